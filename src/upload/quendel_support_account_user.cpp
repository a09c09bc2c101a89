// The local account through which the vendor's support staff log in.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>

#include "base/log.h"
#include "base/paths.h"
#include "platform/file.h"
#include "platform/local_account.h"
#include "quendel/conf.h"
#include "quendel/upload.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_support_account_user";

constexpr uid_t kSupportUserId = 50001;
constexpr gid_t kSupportGroupId = 100;
constexpr int kAccountNotFound = 0x1D00;

struct FreeResult {
  void operator()(ALIBCMRESULT* result) const { ALIBCMResultFree(result); }
};
using OwnedResult = std::unique_ptr<ALIBCMRESULT, FreeResult>;

bool MakeSshDir() {
  if (ALIBCFileCheckDir(kSupportSshDir) != 0) {
    return true;
  }
  if (QUENDELRecursiveMkdir(kSupportSshDir, 0755) != 0 && errno != EEXIST) {
    QUENDEL_LOG("Failed to mkdir '%s'\n", kSupportSshDir);
    return false;
  }
  return true;
}

// The support account owns its home, so whoever held it before may have put a link in place of the
// directory or of the file, to have root write somewhere else. A FIFO would make the open wait for
// ever. What was there is not emptied before it is known.
int OpenKeyFile() {
  const int directory = open(kSupportSshDir, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (directory < 0) {
    return -1;
  }
  const int file = openat(directory, kAuthorizedKeysName,
                          O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0666);
  close(directory);
  return file;
}

// Refuses a file that has another name somewhere else, and whatever cannot be emptied because it is
// no plain file: a FIFO that somebody reads was opened.
bool EmptyPlainFile(int file) {
  struct stat status;
  return fstat(file, &status) == 0 && status.st_nlink == 1 && ftruncate(file, 0) == 0;
}

std::FILE* OpenKeyStream() {
  const int fd = OpenKeyFile();
  if (fd < 0) {
    return nullptr;
  }
  std::FILE* stream = EmptyPlainFile(fd) ? fdopen(fd, "w") : nullptr;
  if (stream == nullptr) {
    close(fd);
  }
  return stream;
}

bool WriteKey(std::FILE* stream, const char* key) {
  // Unbuffered, so that a full disk is seen here and not at the close, which nobody checks.
  setvbuf(stream, nullptr, _IONBF, 0);
  if (fputs(key, stream) <= 0) {
    QUENDEL_LOG("Failed to update '%s'", kAuthorizedKeysFile);
    return false;
  }
  // By the open file: its owner could have put something else in the place of its name by now.
  if (fchmod(fileno(stream), 0644) != 0) {
    QUENDEL_LOG("Failed to chmod '%s'", kAuthorizedKeysFile);
    return false;
  }
  return true;
}

// Judges a deletion that the platform reports as failed: an account that is gone is deleted.
bool IsGone(ALIBCMRESULT* result, const char* user) {
  const int* errors = ALIBCMResultCoreErrorsGet(result);
  if (errors == nullptr) {
    QUENDEL_LOG("ALIBCMResultCoreErrorsGet fail");
    return false;
  }
  if (*errors != kAccountNotFound) {
    QUENDEL_LOG("Failed to delete local account '%s'\n", user);
    return false;
  }
  return true;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELSupportAccountUserCreate(const char* user, const char* key) {
  if (!MakeSshDir()) {
    return -1;
  }
  if (chown(kSupportHome, kSupportUserId, kSupportGroupId) != 0) {
    QUENDEL_LOG("Failed to chown '%s'", kSupportHome);
    return -1;
  }
  if (ARVOLocalAccountUserPrepareForQuendel(user, 5) < 0) {
    QUENDEL_LOG("Failed to prepare local account '%s'", user);
    return -1;
  }
  std::FILE* stream = OpenKeyStream();
  if (stream == nullptr) {
    QUENDEL_LOG("Failed to open '%s'", kAuthorizedKeysFile);
    return -1;
  }
  const bool written = WriteKey(stream, key);
  fclose(stream);
  return written ? 0 : -1;
}

int QUENDELSupportAccountUserDelete(const char* user) {
  const OwnedResult result(ALIBCMResultAlloc());
  if (ALIBCFileCheckDir(kSupportHome) == 1 && QUENDELRecursiveRmdir(kSupportHome) < 0) {
    QUENDEL_LOG("Failed to remove '%s'", kSupportHome);
    return -1;
  }
  if (ARVOLocalAccountUserDelete(&user, 1, result.get()) >= 0) {
    return 0;
  }
  return IsGone(result.get(), user) ? 0 : -1;
}
