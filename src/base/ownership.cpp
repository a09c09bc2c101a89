// Whether what lies at a path below "/tmp", where everybody makes what he likes, is ours.
#include "base/ownership.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "base/owned_fd.h"

namespace quendel {
namespace {

constexpr mode_t kPrivateMode = 0700;
constexpr mode_t kOthersWrite = S_IWGRP | S_IWOTH;

bool BelongsToUs(const struct stat& status) {
  return !S_ISLNK(status.st_mode) && status.st_uid == geteuid();
}

// `here` only names the directory, which takes no mode that way.
bool CloseToOthers(const OwnedFd& here) {
  const OwnedFd directory(openat(here.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return directory && fchmod(directory.get(), kPrivateMode) == 0;
}

// `status` gets what was found.
bool IsOurs(const char* path, struct stat& status) {
  const OwnedFd here(open(path, O_PATH | O_NOFOLLOW | O_CLOEXEC));
  if (!here || fstat(here.get(), &status) != 0) {
    return false;
  }
  if (!BelongsToUs(status)) {
    errno = EPERM;
    return false;
  }
  const bool isOpen = S_ISDIR(status.st_mode) && (status.st_mode & kOthersWrite) != 0;
  return !isOpen || CloseToOthers(here);
}

}  // namespace

bool IsOurs(const char* path) {
  struct stat status;
  return IsOurs(path, status);
}

bool IsOurDirectory(const char* path) {
  struct stat status;
  if (!IsOurs(path, status)) {
    return false;
  }
  errno = ENOTDIR;
  return S_ISDIR(status.st_mode);
}

bool IsOurFileOrNothing(const char* path) {
  struct stat status;
  if (lstat(path, &status) != 0) {
    return errno == ENOENT;
  }
  errno = EPERM;
  return BelongsToUs(status) && S_ISREG(status.st_mode) && status.st_nlink == 1;
}

}  // namespace quendel
