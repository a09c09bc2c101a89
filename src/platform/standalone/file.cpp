// What is at a path, and the locks of the whole platform.
#include "platform/file.h"

#include <sys/stat.h>

#include <cerrno>

#include "platform/standalone/error_code.h"

int ALIBCFileExist(const char* path) {
  struct stat status;
  return path != nullptr && stat(path, &status) == 0 ? 1 : 0;
}

int ALIBCFileCheckDir(const char* path) {
  if (path == nullptr) {
    return platform::FailForArgument();
  }
  struct stat status;
  if (stat(path, &status) == 0) {
    return S_ISDIR(status.st_mode) ? 1 : 0;
  }
  if (errno == ENOENT || errno == ENOTDIR) {
    return 0;
  }
  return platform::Fail(platform::kErrorUnreadable);
}

// The operations of this platform give every lock back before they return, so there is never one
// for this process to release.
int ALIBCFileUnlock(int lockId) {
  return lockId < 0 ? platform::FailForArgument() : 0;
}
