// What the benchmarks set up: collectors with their logs, and other programs to compare with.
//
// Whatever goes wrong ends the program: figures of half a scene would be worse than none.
#ifndef BENCH_SCENE_H_
#define BENCH_SCENE_H_

#include <sys/resource.h>

#include <cstdint>
#include <string>
#include <vector>

namespace bench {

inline constexpr int64_t kMebibyte = int64_t{1} << 20;
inline constexpr int64_t kGibibyte = int64_t{1} << 30;

// Ends the program when something does not hold.
void Require(bool holds, const std::string& what);

void WriteText(const std::string& path, const std::string& text);

// Appends lines as a log has them, about 90 bytes each.
void AppendLines(const std::string& path, int64_t bytes);

// Removes whatever lies there and makes an empty folder.
void MakeEmptyFolder(const std::string& path);

// The file that configures a log collector, and holds its state.
std::string ConfOf(const std::string& name);

// Installs a collector that has collected nothing of its log yet.
void InstallLog(const std::string& name, const std::string& path);

// Runs a program to its end, which must be a good one, its output going to a file. Returns what it
// took, with all that it started; the memory is that of the largest of these processes.
rusage RunProgram(std::vector<std::string> words, const std::string& output);

}  // namespace bench

#endif  // BENCH_SCENE_H_
