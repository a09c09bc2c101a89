#include "rotation_watch.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/inotify.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "json.h"

namespace quendeld {
namespace {

// logrotate holds a lock on it for as long as it works.
constexpr char kLogrotateState[] = "/var/lib/logrotate/status";
constexpr Duration kLookEvery = std::chrono::seconds(1);

bool IsLocked(const char* path) {
  const int file = open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (file < 0) {
    return false;
  }
  const bool locked = flock(file, LOCK_SH | LOCK_NB) != 0;
  close(file);
  return locked;
}

bool HaveAllALine(const Json::Value& logs) {
  return std::all_of(logs.begin(), logs.end(),
                     [](const Json::Value& log) { return BoolOf(log, "has_line"); });
}

}  // namespace

bool IsArchiveName(const std::string& log, const std::string& name) {
  const size_t behind = log.size();
  return name.compare(0, behind, log) == 0 && name.size() > behind + 1 &&
         (name[behind] == '.' || name[behind] == '-') && name[behind + 1] >= '0' &&
         name[behind + 1] <= '9';
}

RotationWatch::RotationWatch(const Context& context, Collections& collections)
    : context_(context),
      collections_(collections),
      timer_(context.loop, [this] { LookWhetherOver(); }),
      lines_timer_(context.loop, [this] { AwaitLines(); }) {
  inotify_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (inotify_ < 0) {
    syslog(LOG_ERR, "the folders of the logs cannot be watched: %m");
    return;
  }
  readable_ = std::make_unique<Readable>(context.loop, inotify_, [this] { Read(); });
}

RotationWatch::~RotationWatch() {
  readable_.reset();
  close(inotify_);
}

void RotationWatch::Watch(const Json::Value& logs) {
  std::map<std::string, std::set<std::string>> wanted;
  for (const Json::Value& log : logs) {
    const std::string path = TextOf(log, "path");
    const size_t slash = path.rfind('/');
    if (slash != std::string::npos) {
      wanted[path.substr(0, slash)].insert(path.substr(slash + 1));
    }
  }
  for (auto folder = folders_.begin(); folder != folders_.end();) {
    if (wanted.count(folder->first) == 0) {
      inotify_rm_watch(inotify_, folder->second);
      folder = folders_.erase(folder);
    } else {
      ++folder;
    }
  }
  log_names_.clear();
  for (const auto& [folder, names] : wanted) {
    const int watch = inotify_add_watch(inotify_, folder.c_str(),
                                        IN_CREATE | IN_MOVED_TO | IN_ONLYDIR | IN_EXCL_UNLINK);
    if (watch >= 0) {
      folders_[folder] = watch;
      log_names_[watch] = names;
    }
  }
}

void RotationWatch::Read() {
  alignas(inotify_event) char events[4096];
  ssize_t got = 0;
  while ((got = read(inotify_, events, sizeof events)) > 0) {
    for (ssize_t at = 0; at < got;) {
      inotify_event event = {};
      memcpy(&event, events + at, sizeof event);
      if (event.len > 0) {
        See(event.wd, events + at + sizeof event);
      }
      at += static_cast<ssize_t>(sizeof event + event.len);
    }
  }
}

void RotationWatch::See(int folder, const std::string& name) {
  const auto names = log_names_.find(folder);
  if (names == log_names_.end() ||
      std::none_of(names->second.begin(), names->second.end(),
                   [&](const std::string& log) { return IsArchiveName(log, name); })) {
    return;
  }
  last_seen_ = context_.loop.Now();
  was_locked_ = was_locked_ || IsLocked(kLogrotateState);
  if (!is_rotating_) {
    is_rotating_ = true;
    lines_timer_.Stop();
    timer_.Start(std::min(kLookEvery, context_.settings.rotation_quiet));
  }
}

// A lock that was seen and is gone tells it for sure; without one, silence has to do.
void RotationWatch::LookWhetherOver() {
  const bool isLocked = IsLocked(kLogrotateState);
  was_locked_ = was_locked_ || isLocked;
  const bool isQuiet = context_.loop.Now() - last_seen_ >= context_.settings.rotation_quiet;
  if (isLocked || (!was_locked_ && !isQuiet)) {
    timer_.Start(std::min(kLookEvery, context_.settings.rotation_quiet));
    return;
  }
  over_since_ = context_.loop.Now();
  is_rotating_ = false;
  was_locked_ = false;
  AwaitLines();
}

// A log that is still empty would be collected as such, and be stuck.
void RotationWatch::AwaitLines() {
  collections_.Look([this] {
    const bool isTooLong = context_.loop.Now() - over_since_ >= context_.settings.rotation_wait;
    if (is_rotating_) {
      return;  // once more
    }
    if (HaveAllALine(collections_.logs()) || isTooLong) {
      collections_.Want("rotation");
    } else {
      lines_timer_.Start(kLookEvery);
    }
  });
}

}  // namespace quendeld
