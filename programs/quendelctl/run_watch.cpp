// What can be seen of a collection run from outside.
#include "run_watch.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <memory>

#include "base/paths.h"
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

// A settings file is replaced by another when it changes, and its folder changes with that.
timespec SettingsChanged() {
  struct stat status = {};
  return stat(quendel::kCollectorConfDir, &status) == 0 ? status.st_mtim : timespec{};
}

bool HaveSettingsChanged(const timespec& before) {
  const timespec now = SettingsChanged();
  return now.tv_sec != before.tv_sec || now.tv_nsec != before.tv_nsec;
}

// Returns nothing where the kernel does not tell.
std::optional<bool> HasChildren(pid_t process) {
  const std::string id = std::to_string(process);
  const std::string path = "/proc/" + id + "/task/" + id + "/children";
  const std::unique_ptr<FILE, int (*)(FILE*)> file(fopen(path.c_str(), "re"), fclose);
  return file == nullptr ? std::nullopt : std::optional<bool>(fgetc(file.get()) != EOF);
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

void RunWatch::Look(pid_t worker) {
  if (directories_.empty()) {
    FindDirectories();
  }
  const std::optional<bool> children = HasChildren(worker);
  started_ = started_ || children.value_or(false);
  if (directories_.empty()) {
    return;
  }
  Phase phase = Phase::kCollecting;
  if (ArchiveBytes()) {
    const Phase afterPacking = send_ ? Phase::kSending : Phase::kCommitting;
    phase = children.value_or(true) ? Phase::kPacking : afterPacking;
    if (HaveSettingsChanged(settingsChanged_)) {
      phase = Phase::kCommitting;
    }
  }
  phase_ = std::max(phase_, phase);
}

// A run has made its directory before it has children, and one that never had both of them does not
// return. So one of the new directories is its own; before that, all of them may be others'.
void RunWatch::Settle(bool returned) {
  directories_.clear();
  if (returned || started_) {
    FindDirectories();
  }
}

std::string RunWatch::Directory() const {
  return directories_.size() == 1 ? *directories_.begin() : "";
}

std::string RunWatch::Archive() const {
  return directories_.size() == 1 ? Directory() + ".tar.xz" : "";
}

std::optional<uint64_t> RunWatch::ArchiveBytes() const {
  struct stat status = {};
  if (lstat(Archive().c_str(), &status) != 0 || !S_ISREG(status.st_mode)) {
    return std::nullopt;
  }
  return static_cast<uint64_t>(status.st_size);
}

std::set<std::string> RunWatch::Logs(uint64_t leastBytes) const {
  std::set<std::string> names;
  ForEachEntry(Directory() + "/log", [&](const fs::directory_entry& entry) {
    std::error_code error;
    const uint64_t bytes = entry.file_size(error);
    if (!error && bytes >= leastBytes) {
      names.insert(LogName(entry.path().filename()));
    }
  });
  return names;
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

void RunWatch::FindDirectories() {
  for (const std::string& path : RunDirectories()) {
    if (before_.count(path) == 0) {
      directories_.insert(path);
    }
  }
}

}  // namespace quendelctl
