#include "worker/leftovers.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <regex>

#include "base/paths.h"
#include "common/collect_lock.h"
#include "json.h"
#include "quendel.h"
#include "worker/outbox.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

namespace fs = std::filesystem;
using quendel::programs::CollectLock;

bool IsOurs(const fs::path& path, mode_t kind) {
  struct stat status = {};
  return lstat(path.c_str(), &status) == 0 && (status.st_mode & S_IFMT) == kind &&
         status.st_uid == geteuid();
}

// Returns the entries of a folder whose whole names the pattern fits.
std::set<fs::path> Entries(const fs::path& folder, const std::regex& pattern) {
  std::set<fs::path> entries;
  std::error_code error;
  for (fs::directory_iterator entry(folder, error); !error && entry != fs::directory_iterator();
       entry.increment(error)) {
    if (std::regex_match(entry->path().filename().string(), pattern)) {
      entries.insert(entry->path());
    }
  }
  return entries;
}

void RemoveAndTell(const fs::path& path) {
  QUENDELRecursiveRmdir(path.c_str());
  syslog(LOG_INFO, "removed %s, left by work that was broken off", path.c_str());
}

// Archives of dead runs. One of a run that was not to be sent may have been counted as collected
// already, and is all there is of its lines: it is sent later, perhaps a second time.
void ClearRuns(const Json::Value& request) {
  static const std::regex kArchive(R"(quendel_[0-9]{8}_[0-9]{6}_[0-9]+\.tar\.xz)");
  for (const fs::path& directory : RunDirectories()) {
    RemoveAndTell(directory);
  }
  for (const fs::path& archive : Entries("/tmp", kArchive)) {
    const bool isKept = quendeld::BoolOf(request, "unsent");
    struct stat status = {};
    if (!IsOurs(archive, S_IFREG) || stat(archive.c_str(), &status) != 0) {
      continue;
    }
    if (!isKept || !PutIntoOutbox(archive, status.st_mtime)) {
      RemoveAndTell(archive);
    }
  }
}

void ClearMarkers() {
  static const std::regex kMarker("(udc|log)\\.p\\.[0-9]+");
  for (const fs::path& marker : Entries(quendel::kWorkRoot, kMarker)) {
    const std::string number = marker.extension().string().substr(1);
    const pid_t process = static_cast<pid_t>(strtol(number.c_str(), nullptr, 10));
    if (IsOurs(marker, S_IFREG) && kill(process, 0) != 0 && errno == ESRCH) {
      RemoveAndTell(marker);
    }
  }
}

// An upload removes the folder of the kind that it prepared last, and never the debug archive.
void ClearUploads() {
  for (const char* folder : {quendel::kDumpDir, quendel::kDebugDir}) {
    if (IsOurs(folder, S_IFDIR)) {
      RemoveAndTell(folder);
    }
  }
  const std::string archive = std::string(quendel::kDebugDir) + ".zip";
  if (IsOurs(archive, S_IFREG)) {
    unlink(archive.c_str());
  }
}

}  // namespace

std::set<fs::path> RunDirectories() {
  static const std::regex kRun("quendel_[0-9]{8}_[0-9]{6}_[0-9]+");
  std::set<fs::path> directories = Entries("/tmp", kRun);
  for (auto directory = directories.begin(); directory != directories.end();) {
    directory = IsOurs(*directory, S_IFDIR) ? std::next(directory) : directories.erase(directory);
  }
  return directories;
}

// Under the lock: what a run that goes on is using is not left by a dead one. The daemon has no
// upload going on meanwhile.
Json::Value Tidy(const Json::Value& request) {
  CollectLock lock("quendeld");
  if (lock.Take() != CollectLock::Result::kTaken) {
    return Failed();
  }
  ClearRuns(request);
  ClearMarkers();
  ClearUploads();
  Json::Value answer = Json::objectValue;
  answer["result"] = 0;
  answer["outbox"] = DescribeOutbox();
  return answer;
}

}  // namespace quendel_worker
