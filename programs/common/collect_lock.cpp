// The lock that lets one collection run go on at a time on a device, whichever program runs it.
#include "common/collect_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <csignal>
#include <string_view>

#include "base/paths.h"

namespace quendel::programs {
namespace {

// The file is removed between two of these by nobody who means well.
constexpr int kMostAttempts = 10;

int CloseAndFail(int descriptor, int reason) {
  close(descriptor);
  errno = reason;
  return -1;
}

// Opens the folder, which is made when it is missing. One that others can write to could be given
// another file each time. Returns -1 with errno on failure.
int OpenFolder() {
  if (mkdir(kProgramsRunDir, 0755) != 0 && errno != EEXIST) {
    return -1;
  }
  const int folder = open(kProgramsRunDir, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (folder < 0) {
    return -1;
  }
  struct stat status = {};
  if (fstat(folder, &status) != 0) {
    return CloseAndFail(folder, errno);
  }
  const bool ours = status.st_uid == geteuid() || status.st_uid == 0;
  return ours && (status.st_mode & 022) == 0 ? folder : CloseAndFail(folder, EPERM);
}

int OpenFileIn(int folder) {
  constexpr int kFlags = O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  const int file = openat(folder, kCollectLockName, kFlags, 0600);
  struct stat status = {};
  if (file >= 0 && (fstat(file, &status) != 0 || !S_ISREG(status.st_mode))) {
    return CloseAndFail(file, EPERM);
  }
  return file;
}

bool Lives(pid_t process) {
  return kill(process, 0) == 0 || errno != ESRCH;
}

}  // namespace

CollectLock::Result CollectLock::Lock(bool wait) {
  holder_ = {};
  for (int attempt = 0; attempt < kMostAttempts; ++attempt) {
    Close();
    if (!Open()) {
      return Result::kFailed;
    }
    if (flock(file_, wait ? LOCK_EX : LOCK_EX | LOCK_NB) != 0) {
      const int reason = errno;
      if (reason == EWOULDBLOCK) {
        ReadHolder();
      }
      Close();
      errno = reason;
      return reason == EWOULDBLOCK ? Result::kHeld : Result::kFailed;
    }
    if (IsInPlace()) {
      WriteHolder();
      return Result::kTaken;
    }
  }
  Close();
  errno = ESTALE;
  return Result::kFailed;
}

bool CollectLock::Open() {
  const int folder = OpenFolder();
  if (folder < 0) {
    return false;
  }
  file_ = OpenFileIn(folder);
  const int reason = errno;
  close(folder);
  errno = reason;
  return file_ >= 0;
}

void CollectLock::Close() {
  if (file_ >= 0) {
    close(file_);
    file_ = -1;
  }
}

// Whoever comes next finds the same file. It may have been removed before it was locked.
bool CollectLock::IsInPlace() const {
  struct stat locked = {};
  struct stat found = {};
  return fstat(file_, &locked) == 0 && lstat(kCollectLockFile, &found) == 0 &&
         locked.st_dev == found.st_dev && locked.st_ino == found.st_ino;
}

// A process that does not live any more left its name and died; another one has the lock now.
void CollectLock::ReadHolder() {
  char text[256];
  const ssize_t size = pread(file_, text, sizeof text, 0);
  const std::string_view line(text, size > 0 ? static_cast<size_t>(size) : 0);
  const size_t lineEnd = line.find('\n');
  pid_t process = 0;
  const auto [stop, error] = std::from_chars(line.data(), line.data() + line.size(), process);
  if (lineEnd == line.npos || error != std::errc() || *stop != ' ' || process < 1 ||
      !Lives(process)) {
    return;
  }
  const auto name = static_cast<size_t>(stop - line.data()) + 1;
  holder_ = {process, std::string(line.substr(name, lineEnd - name))};
}

// A name that does not get there, as the disk is full, is missed by others only.
void CollectLock::WriteHolder() const {
  const std::string line = std::to_string(getpid()) + " " + program_ + "\n";
  if (ftruncate(file_, 0) != 0 || pwrite(file_, line.data(), line.size(), 0) < 0) {
    return;
  }
}

}  // namespace quendel::programs
