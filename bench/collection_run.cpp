// How long whole collection runs take, from the new lines of a log to the packed archive, against
// tar and xz alone on the same bytes, and how much memory the largest of their processes holds.
//
//   collection_run MIB...    with logs of so many MiB
//
// Runs on an appliance of its own, with /tmp on a disk; script/bench starts it. With the argument
// "--collect" it is one run: each has a process of its own.
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include "quendel.h"
#include "scene.h"
#include "support/appliance_only.h"

using namespace bench;

namespace {

namespace fs = std::filesystem;

constexpr char kLog[] = "/tmp/logs/messages";

struct Cost {
  double seconds;
  double peak_mebibytes;
};

Cost Measure(const std::vector<std::string>& words) {
  const auto start = std::chrono::steady_clock::now();
  const rusage usage = RunProgram(words, "/dev/null");
  const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
  return {taken.count(), static_cast<double>(usage.ru_maxrss) / 1024};
}

// Returns what the run left below /tmp: its directory, or the archive beside it.
fs::path LeftByRun(bool isDirectory) {
  for (const fs::directory_entry& entry : fs::directory_iterator("/tmp")) {
    const std::string name = entry.path().filename();
    if (name.rfind("quendel_", 0) == 0 && entry.is_directory() == isDirectory) {
      return entry.path();
    }
  }
  Require(false, isDirectory ? "the run's directory" : "the run's archive");
  return {};
}

void MeasureRun(int64_t mebibytes) {
  for (const char* folder : {"/tmp/logs", "/tmp/quendel", "/usr/arvo/etc/quendel"}) {
    MakeEmptyFolder(folder);
  }
  WriteText(kLog, "");
  AppendLines(kLog, mebibytes * kMebibyte);
  InstallLog("m", kLog);
  const Cost run = Measure({"/proc/self/exe", "--collect"});
  Require(fs::file_size(LeftByRun(true) / "log/m") == fs::file_size(kLog), "the whole log");
  const Cost tar = Measure({"/bin/tar", "-C", "/tmp", "-Jcf", "/tmp/peer.tar.xz", "logs"});
  printf("%8ld %10.2f %10.2f %8.2f %12.1f %12.1f\n", static_cast<long>(mebibytes), run.seconds,
         tar.seconds, run.seconds / tar.seconds, run.peak_mebibytes, tar.peak_mebibytes);
  fflush(stdout);
  fs::remove_all(LeftByRun(true));
  fs::remove(LeftByRun(false));
}

// A run may signal its process group.
int Collect() {
  setsid();
  return QUENDELStartCollect(0, 0, Json::Value(Json::objectValue)) == 0 ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  quendel::test::EndUnlessOnAppliance("script/bench");
  if (argc == 2 && strcmp(argv[1], "--collect") == 0) {
    return Collect();
  }
  printf("%8s %10s %10s %8s %12s %12s\n", "log/MiB", "run/s", "tar/s", "ratio", "peak/MiB",
         "tar's/MiB");
  for (int i = 1; i < argc; ++i) {
    MeasureRun(atol(argv[i]));
  }
  return 0;
}
