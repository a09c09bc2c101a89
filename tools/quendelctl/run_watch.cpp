// What can be seen of a collection run from outside.
#include "run_watch.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <filesystem>
#include <memory>

#include "collector_files.h"

namespace quendelctl {
namespace {

namespace fs = std::filesystem;

// Calls a function with each entry of a folder; one that cannot be read has none.
template <typename Visit>
void ForEachEntry(const std::string& folder, Visit visit) {
  std::error_code error;
  for (fs::directory_iterator entry(folder, error); !error && entry != fs::directory_iterator();
       entry.increment(error)) {
    visit(*entry);
  }
}

std::set<std::string> RunDirectories() {
  constexpr char kPrefix[] = "quendel_";
  std::set<std::string> paths;
  ForEachEntry("/tmp", [&](const fs::directory_entry& entry) {
    std::error_code error;
    if (entry.path().filename().native().rfind(kPrefix, 0) == 0 && entry.is_directory(error) &&
        !entry.is_symlink(error)) {
      paths.insert(entry.path());
    }
  });
  return paths;
}

// Returns the name of a log that a file was collected from: an archive's has ".1.xz" and so on
// behind it.
std::string LogName(const std::string& file) {
  constexpr char kEnd[] = ".xz";
  const size_t end = file.size() - std::min(file.size(), sizeof(kEnd) - 1);
  if (file.compare(end, file.npos, kEnd) != 0) {
    return file;
  }
  const size_t dot = file.find_last_not_of("0123456789", end == 0 ? 0 : end - 1);
  const bool numbered = dot != file.npos && dot > 0 && file[dot] == '.' && dot + 1 < end;
  return numbered ? file.substr(0, dot) : file;
}

std::set<std::string> CollectedLogs(const std::string& run) {
  std::set<std::string> names;
  ForEachEntry(run + "/log", [&](const fs::directory_entry& entry) {
    names.insert(LogName(entry.path().filename()));
  });
  return names;
}

// A settings file is replaced by another when it changes, and its folder changes with that.
timespec SettingsChanged() {
  struct stat status = {};
  return stat(kCollectorFolder, &status) == 0 ? status.st_mtim : timespec{};
}

bool HaveSettingsChanged(const timespec& before) {
  const timespec now = SettingsChanged();
  return now.tv_sec != before.tv_sec || now.tv_nsec != before.tv_nsec;
}

// Where the kernel does not tell, a process counts as having children.
bool HasChildren(pid_t process) {
  const std::string id = std::to_string(process);
  const std::string path = "/proc/" + id + "/task/" + id + "/children";
  const std::unique_ptr<FILE, int (*)(FILE*)> file(fopen(path.c_str(), "re"), fclose);
  return file == nullptr || fgetc(file.get()) != EOF;
}

}  // namespace

const char* PhaseName(Phase phase) {
  switch (phase) {
    case Phase::kStarting:
      return "starting";
    case Phase::kCheckingServer:
      return "checking the server";
    case Phase::kCollecting:
      return "collecting";
    case Phase::kPacking:
      return "packing";
    case Phase::kSending:
      return "sending";
    case Phase::kCommitting:
      return "committing";
  }
  return "";
}

RunWatch::RunWatch(bool send)
    : send_(send),
      installedLogs_(CollectorFiles(kLogPrefix).size()),
      before_(RunDirectories()),
      settingsChanged_(SettingsChanged()),
      phase_(send ? Phase::kCheckingServer : Phase::kStarting) {
}

RunWatch::~RunWatch() {
  if (archive_ >= 0) {
    close(archive_);
  }
}

void RunWatch::Look(pid_t worker) {
  if (directories_.empty()) {
    FindDirectory();
  }
  if (directories_.empty()) {
    return;
  }
  OpenArchive();
  Phase phase = Phase::kCollecting;
  if (archive_ >= 0) {
    phase = HasChildren(worker) ? Phase::kPacking : send_ ? Phase::kSending : Phase::kCommitting;
    if (HaveSettingsChanged(settingsChanged_)) {
      phase = Phase::kCommitting;
    }
  }
  phase_ = std::max(phase_, phase);
}

std::string RunWatch::Directory() const {
  return directories_.size() == 1 ? *directories_.begin() : "";
}

std::string RunWatch::Archive() const {
  return directories_.size() == 1 ? Directory() + ".tar.xz" : "";
}

std::optional<uint64_t> RunWatch::ArchiveBytes() const {
  struct stat status = {};
  if (archive_ < 0 || fstat(archive_, &status) != 0) {
    return std::nullopt;
  }
  return static_cast<uint64_t>(status.st_size);
}

size_t RunWatch::CountLogsSoFar() const {
  return logs_ ? logs_->size() : CollectedLogs(Directory()).size();
}

uint64_t RunWatch::BytesSoFar() const {
  uint64_t bytes = 0;
  for (const char* part : {"/log", "/udc", "/perf"}) {
    ForEachEntry(Directory() + part, [&](const fs::directory_entry& entry) {
      struct stat status = {};
      if (lstat(entry.path().c_str(), &status) == 0 && S_ISREG(status.st_mode)) {
        bytes += static_cast<uint64_t>(status.st_size);
      }
    });
  }
  return bytes;
}

void RunWatch::FindDirectory() {
  for (const std::string& path : RunDirectories()) {
    if (before_.count(path) == 0) {
      directories_.insert(path);
    }
  }
}

// The collectors are done when there is an archive, and what they left stays until the run ends.
// The open file outlives its name.
void RunWatch::OpenArchive() {
  if (archive_ >= 0 || Archive().empty()) {
    return;
  }
  archive_ = open(Archive().c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
  if (archive_ >= 0) {
    logs_ = CollectedLogs(Directory());
  }
}

}  // namespace quendelctl
