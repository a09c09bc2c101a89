// What tells one file from another.
#include "platform/standalone/file_identity.h"

#include <fcntl.h>

#include <atomic>
#include <cerrno>
#include <string>

#include "base/log.h"
#include "platform/standalone/device_conf.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr char kLogUnit[] = "file_identity";

// How the device's settings want files told apart.
enum class Identity { kInode, kBirth, kUnknown };

// A device without settings has the default. Settings that cannot be read could say either, and the
// wrong answer would make every file another one.
Identity WantedIdentity() {
  DeviceConf conf;
  if (!conf.Read()) {
    return quendel::IsAbsence(errno) ? Identity::kInode : Identity::kUnknown;
  }
  return conf.Value("file_identity") == "birth" ? Identity::kBirth : Identity::kInode;
}

// One line for each process is enough to find out why files are taken for others.
void SayThatNumbersAreUsed(const char* path) {
  static std::atomic<bool> isSaid{false};
  if (!isSaid.exchange(true)) {
    QUENDEL_LOG("'%s' has no time of birth; it is known by its inode number alone", path);
  }
}

int FailToLook() {
  return Fail(errno == ENOENT || errno == ENOTDIR ? kErrorNotFound : kErrorUnreadable);
}

// The descriptor makes sure that number, birth and size are those of one file, whatever is rotated
// meanwhile.
int StatWithBirth(const char* path, struct stat& status) {
  const OwnedFd file(open(path, O_PATH | O_CLOEXEC));
  struct statx more;
  if (!file || fstat(file.get(), &status) != 0 ||
      statx(file.get(), "", AT_EMPTY_PATH, STATX_BTIME, &more) != 0) {
    return FailToLook();
  }
  if ((more.stx_mask & STATX_BTIME) == 0) {
    SayThatNumbersAreUsed(path);
    return 0;
  }
  status.st_ino = MixIdentity(status.st_ino, more.stx_btime.tv_sec, more.stx_btime.tv_nsec);
  return 0;
}

// A step of the splitmix64 generator: each bit of the input changes half of the output's.
uint64_t Mix(uint64_t bits) {
  bits += 0x9e3779b97f4a7c15;
  bits = (bits ^ (bits >> 30)) * 0xbf58476d1ce4e5b9;
  bits = (bits ^ (bits >> 27)) * 0x94d049bb133111eb;
  return bits ^ (bits >> 31);
}

}  // namespace

uint32_t MixIdentity(uint64_t inode, int64_t birthSeconds, uint32_t birthNanoseconds) {
  const uint64_t mixed =
      Mix(Mix(Mix(inode) ^ static_cast<uint64_t>(birthSeconds)) ^ birthNanoseconds);
  const uint32_t identity = static_cast<uint32_t>(mixed);
  // A log that was reset reads as 0, and must not be taken for known.
  return identity == 0 ? 1 : identity;
}

int StatWithIdentity(const char* path, struct stat& status) {
  switch (WantedIdentity()) {
    case Identity::kInode:
      return stat(path, &status) == 0 ? 0 : FailToLook();
    case Identity::kBirth:
      return StatWithBirth(path, status);
    case Identity::kUnknown:
      break;
  }
  return Fail(kErrorUnreadable);
}

}  // namespace platform
