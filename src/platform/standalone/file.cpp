// What is at a path, and the locks of the whole platform.
#include "platform/file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "platform/standalone/error_code.h"
#include "platform/standalone/file_identity.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr int kFollowLinks = 1;
constexpr mode_t kTouchedFileMode = 0644;

}  // namespace
}  // namespace platform

int ALIBCFileExist(const char* path) {
  struct stat status;
  if (path == nullptr) {
    return 0;
  }
  if (stat(path, &status) == 0) {
    return 1;
  }
  return quendel::IsAbsence(errno) ? 0 : platform::Fail(platform::kErrorUnreadable);
}

int ALIBCFileCheckDir(const char* path) {
  if (path == nullptr) {
    return platform::FailForArgument();
  }
  struct stat status;
  if (stat(path, &status) == 0) {
    return S_ISDIR(status.st_mode) ? 1 : 0;
  }
  return quendel::IsAbsence(errno) ? 0 : platform::Fail(platform::kErrorUnreadable);
}

// The operations of this platform give every lock back before they return, so there is never one
// for this process to release.
int ALIBCFileUnlock(int lockId) {
  return lockId < 0 ? platform::FailForArgument() : 0;
}

int ALIBCFileStat(const char* path, int flags, struct stat* status) try {
  if (path == nullptr || status == nullptr || flags != platform::kFollowLinks) {
    return platform::FailForArgument();
  }
  return platform::StatWithIdentity(path, *status);
} catch (...) {
  return platform::FailForException();
}

int ALIBCFileTouch(const char* path) {
  if (path == nullptr) {
    return platform::FailForArgument();
  }
  if (utimensat(AT_FDCWD, path, nullptr, 0) == 0) {
    return 0;
  }
  if (errno != ENOENT) {
    return platform::Fail(platform::kErrorWriteFailed);
  }
  constexpr int kCreate = O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC;
  const platform::OwnedFd created(open(path, kCreate, platform::kTouchedFileMode));
  // Somebody else may have created it meanwhile; what is there is a link to nothing otherwise.
  const bool isThere = created || (errno == EEXIST && utimensat(AT_FDCWD, path, nullptr, 0) == 0);
  return isThere ? 0 : platform::Fail(platform::kErrorWriteFailed);
}
