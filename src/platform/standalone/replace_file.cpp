// Changing a file so that nobody ever sees half of the change.
#include "platform/standalone/replace_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <thread>

#include "platform/standalone/error_code.h"

namespace platform {
namespace {

constexpr mode_t kPrivateMode = 0600;

// How long a writer waits for another one: 10 s. Whoever may write to the folder could hold the
// lock for ever.
constexpr auto kPollInterval = std::chrono::milliseconds(2);
constexpr int kMaxPolls = 5000;

// What is left of the 255 bytes that a file name may have, less the dot and the longest suffix.
constexpr size_t kMaxNamePartBytes = 240;

std::string DirectoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos) {
    return ".";
  }
  return path.substr(0, slash == 0 ? 1 : slash);
}

// Names begin with a dot, so that no listing takes these files for settings of their own. Two very
// long names may share one: they then wait for each other, which does no harm.
std::string HiddenNameBeside(const std::string& path, const char* suffix) {
  const size_t slash = path.rfind('/');
  const size_t begin = slash == std::string::npos ? 0 : slash + 1;
  return path.substr(0, begin) + '.' + path.substr(begin, kMaxNamePartBytes) + suffix;
}

bool NamesThisFile(const char* path, int fd) {
  struct stat named;
  struct stat open;
  return stat(path, &named) == 0 && fstat(fd, &open) == 0 && named.st_dev == open.st_dev &&
         named.st_ino == open.st_ino;
}

// Waits for the lock on a file, for as many polls as are left. Returns false with errno set when it
// was not to be had.
bool WaitForLock(int fd, int& pollsLeft) {
  while (flock(fd, LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK || pollsLeft-- <= 0) {
      return false;
    }
    std::this_thread::sleep_for(kPollInterval);
  }
  return true;
}

bool TakeOver(int fd, const struct stat& old) {
  struct stat fresh;
  if (fstat(fd, &fresh) != 0) {
    return false;
  }
  const bool sameOwner = fresh.st_uid == old.st_uid && fresh.st_gid == old.st_gid;
  if (!sameOwner && fchown(fd, old.st_uid, old.st_gid) != 0) {
    return false;
  }
  return fchmod(fd, old.st_mode & 07777) == 0;
}

bool WriteNewFile(const std::string& path, const std::string& text, const struct stat& old) {
  // Only the holder of the lock comes here: what lies there was left by a killed process.
  if (unlink(path.c_str()) != 0 && errno != ENOENT) {
    return false;
  }
  OwnedFd file(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kPrivateMode));
  if (!file || !quendel::WriteAll(file.get(), text) || !TakeOver(file.get(), old) ||
      fsync(file.get()) != 0) {
    return false;
  }
  return file.Close();
}

// A file system that cannot synchronise a directory says EINVAL: there is nothing to be done then.
bool SynchroniseDirectory(const std::string& path) {
  const OwnedFd directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return directory && (fsync(directory.get()) == 0 || errno == EINVAL);
}

int ReplaceFile(const std::string& path, const std::string& text, const struct stat& old) {
  const std::string newPath = HiddenNameBeside(path, ".new");
  if (!WriteNewFile(newPath, text, old) || rename(newPath.c_str(), path.c_str()) != 0) {
    const int reason = errno;
    unlink(newPath.c_str());
    errno = reason;
    return Fail(kErrorWriteFailed);
  }
  return SynchroniseDirectory(DirectoryOf(path)) ? 0 : Fail(kErrorNotSynchronised);
}

int ChangeLockedFile(const std::string& path, const Change& change) {
  struct stat old;
  const OwnedFd file = OpenForReading(path.c_str(), old);
  std::string oldText;
  if (!file || !ReadToEnd(file.get(), old.st_size, oldText)) {
    return -1;
  }
  const std::string newText = change(oldText);
  if (newText == oldText) {
    return fsync(file.get()) == 0 ? 0 : Fail(kErrorNotSynchronised);
  }
  return ReplaceFile(path, newText, old);
}

}  // namespace

FileLock::FileLock(const std::string& target) : path_(HiddenNameBeside(target, ".lock")) {
  for (int pollsLeft = kMaxPolls;;) {
    OwnedFd file(
        open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, kPrivateMode));
    if (!file || !WaitForLock(file.get(), pollsLeft)) {
      Fail(kErrorLockFailed);
      return;
    }
    // The holder before us may have removed the file that we waited for.
    if (NamesThisFile(path_.c_str(), file.get())) {
      file_ = std::move(file);
      return;
    }
    if (pollsLeft-- <= 0) {
      errno = EWOULDBLOCK;
      Fail(kErrorLockFailed);
      return;
    }
  }
}

FileLock::~FileLock() {
  if (!file_) {
    return;
  }
  const int reason = errno;
  unlink(path_.c_str());
  // A child forked meanwhile by another thread shares the lock: closing alone would not release it.
  flock(file_.get(), LOCK_UN);
  errno = reason;
}

int ChangeFile(const char* path, const Change& change) {
  // The file itself is replaced, not a link to it; and every name of the file has the same lock.
  const std::unique_ptr<char, void (*)(void*)> realPath(realpath(path, nullptr), free);
  if (!realPath) {
    return Fail(errno == ENOENT || errno == ENOTDIR ? kErrorNotFound : kErrorUnreadable);
  }
  const std::string target = realPath.get();
  const FileLock lock(target);
  return lock ? ChangeLockedFile(target, change) : -1;
}

}  // namespace platform
