// Packs a run directory into one archive.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <utility>

#include "base/log.h"
#include "base/owned_fd.h"
#include "platform/process.h"
#include "quendel/collect.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_tar_collect_data";

constexpr mode_t kPrivateMode = 0600;

// The file that tar is to fill.
struct Archive {
  OwnedFd file;
  bool is_new;
};

// What an archive of that name can be: a file of ours, with no other name somewhere else.
bool IsOurFile(int file) {
  struct stat status;
  return fstat(file, &status) == 0 && S_ISREG(status.st_mode) && status.st_uid == geteuid() &&
         status.st_nlink == 1;
}

// Makes the archive's file before tar does, or takes an older one: tar fills what it finds, with
// lines of logs that not everybody may read. It follows no link and waits for no reader of a FIFO.
Archive OpenArchive(const char* path) {
  constexpr int kFlags = O_WRONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  OwnedFd made(open(path, kFlags | O_CREAT | O_EXCL, kPrivateMode));
  if (made || errno != EEXIST) {
    return {std::move(made), true};
  }
  OwnedFd found(open(path, kFlags));
  const bool taken = found && IsOurFile(found.get()) && fchmod(found.get(), kPrivateMode) == 0;
  return {taken ? std::move(found) : OwnedFd(), false};
}

// What tar wrote before it failed stays, as it always did.
void RemoveIfEmpty(const Archive& archive, const char* path) {
  struct stat status;
  if (archive.is_new && fstat(archive.file.get(), &status) == 0 && status.st_size == 0) {
    unlink(path);
  }
}

bool Pack(const char* dir, const char* path) {
  const std::string directory = dir;
  const size_t slash = directory.rfind('/');
  const std::string parent = directory.substr(0, slash);
  const std::string base = slash == std::string::npos ? directory : directory.substr(slash + 1);
  const Archive archive = OpenArchive(path);
  if (!archive.file) {
    return false;
  }
  if (ALIBCExecl("/bin/tar", platform::kRunFlags, "-C", parent.c_str(), "-Jcvf", path, base.c_str(),
                 nullptr) != 0) {
    RemoveIfEmpty(archive, path);
    return false;
  }
  return true;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELTarCollectData(const char* dir, const char* archive) try {
  if (!Pack(dir, archive)) {
    QUENDEL_LOG("Failed to tar '%s'", dir);
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to tar '%s'", dir);
  return -1;
}
