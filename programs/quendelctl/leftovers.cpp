// What collection runs that died have left behind.
#include "leftovers.h"

#include <regex.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <new>

#include "base/paths.h"

namespace quendelctl {
namespace {

namespace fs = std::filesystem;

constexpr char kRunPattern[] = "^/tmp/quendel_[0-9]{8}_[0-9]{6}_[0-9]+$";
constexpr char kMarkerPattern[] = "^/tmp/quendel/(udc|log)\\.p\\.[0-9]+$";

// The sticky bit, which does nothing to a directory that is its owner's alone.
constexpr mode_t kKeptBit = S_ISVTX;

// Returns the paths in a folder that match, sorted; of one that cannot be read none.
std::vector<std::string> Matching(const char* folder, const char* pattern) {
  regex_t expression;
  if (regcomp(&expression, pattern, REG_EXTENDED | REG_NOSUB) != 0) {
    throw std::bad_alloc();
  }
  std::vector<std::string> paths;
  std::error_code error;
  for (fs::directory_iterator entry(folder, error); !error && entry != fs::directory_iterator();
       entry.increment(error)) {
    if (regexec(&expression, entry->path().c_str(), 0, nullptr, 0) == 0) {
      paths.push_back(entry->path());
    }
  }
  regfree(&expression);
  std::sort(paths.begin(), paths.end());
  return paths;
}

bool IsOwn(const std::string& path, mode_t type, struct stat& status) {
  return lstat(path.c_str(), &status) == 0 && (status.st_mode & S_IFMT) == type &&
         status.st_uid == geteuid();
}

// Another process may have the number by now. Then the marker stays as long as that one lives.
bool Lives(const std::string& marker) {
  const long number = strtol(marker.c_str() + marker.rfind('.') + 1, nullptr, 10);
  return number > 0 && (kill(static_cast<pid_t>(number), 0) == 0 || errno != ESRCH);
}

bool HoldsOnlyWhatARunMakes(const std::string& directory) {
  std::error_code error;
  for (fs::directory_iterator entry(directory, error); !error && entry != fs::directory_iterator();
       entry.increment(error)) {
    const std::string name = entry->path().filename();
    if (name != "udc" && name != "log" && name != "perf") {
      return false;
    }
  }
  return !error;
}

bool IsOfADeadRun(const std::string& directory) {
  constexpr mode_t kRunMode = 0700;
  struct stat status = {};
  return IsOwn(directory, S_IFDIR, status) && (status.st_mode & 07777) == kRunMode &&
         HoldsOnlyWhatARunMakes(directory);
}

std::vector<std::string> Markers() {
  std::vector<std::string> own;
  for (const std::string& path : Matching(quendel::kWorkRoot, kMarkerPattern)) {
    struct stat status = {};
    if (IsOwn(path, S_IFREG, status) && status.st_size == 0) {
      own.push_back(path);
    }
  }
  return own;
}

}  // namespace

std::vector<std::string> FindLeftovers() {
  std::vector<std::string> leftovers = Markers();
  if (std::any_of(leftovers.begin(), leftovers.end(), Lives)) {
    return {};
  }
  for (const std::string& directory : Matching("/tmp", kRunPattern)) {
    if (!IsOfADeadRun(directory)) {
      continue;
    }
    struct stat status = {};
    const std::string archive = directory + ".tar.xz";
    if (IsOwn(archive, S_IFREG, status)) {
      leftovers.push_back(archive);  // before the directory, without which it is nobody's
    }
    leftovers.push_back(directory);
  }
  return leftovers;
}

void MarkAsKept(const std::string& directory) {
  if (chmod(directory.c_str(), 0700 | kKeptBit) != 0) {
    return;  // it has gone meanwhile
  }
}

void RemoveStaleMarkers() {
  for (const std::string& marker : Markers()) {
    if (!Lives(marker)) {
      unlink(marker.c_str());
    }
  }
}

}  // namespace quendelctl
