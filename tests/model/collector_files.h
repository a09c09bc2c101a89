// The files around the log collector: its configuration, its state, the logs, and what a run
// leaves.
#ifndef TESTS_MODEL_COLLECTOR_FILES_H_
#define TESTS_MODEL_COLLECTOR_FILES_H_

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "support/device.h"

namespace quendel::test {

inline constexpr char kLogUpdateFile[] = "/tmp/quendel/quendel.log.update.conf";
inline constexpr char kRunFolder[] = "/tmp/quendel_run/log";

using Pairs = std::map<std::string, std::string>;
using Sections = std::vector<std::pair<std::string, Pairs>>;

// The pairs of a configuration file, and the sections of what the last run staged.
Pairs ReadPairs(const std::string& path);
Sections ReadStaged();

// Gives a path this inode number from now on, whatever file is there.
void ShowInode(const std::string& path, uint64_t inode);

// Has something happen once, as soon as the collector has learned the size and inode of this file.
void OnceMeasured(const std::string& path, std::function<void()> action);

// Collects into an emptied run folder. Returns the collector's result.
int Collect();

// Commits what was staged, and expects no failure.
void Commit();

// Collects and commits, and expects no failure and nothing logged.
void CollectAndCommit();

// What the last run wrote: file names and texts, archives (".xz" at the end) decompressed.
std::map<std::string, std::string> Delivered();

}  // namespace quendel::test

#endif  // TESTS_MODEL_COLLECTOR_FILES_H_
