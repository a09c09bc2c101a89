// Files read whole, with the platform's last error set on failure.
#include "platform/standalone/file_io.h"

#include <unistd.h>

#include <cerrno>

#include "platform/standalone/error_code.h"

namespace platform {
namespace {

constexpr size_t kReadBlockBytes = size_t{64} * 1024;

ErrorCode CodeOfFailedOpen() {
  switch (errno) {
    case ENOENT:
    case ENOTDIR:
      return kErrorNotFound;
    case EISDIR:
    case EINVAL:
      return kErrorNotRegular;
    default:
      return kErrorUnreadable;
  }
}

}  // namespace

OwnedFd OpenForReading(const char* path, struct stat& status) {
  OwnedFd file = quendel::OpenRegularFile(path, status);
  if (!file) {
    Fail(CodeOfFailedOpen());
  }
  return file;
}

bool ReadToEnd(int file, off_t sizeHint, std::string& text) {
  // One byte more than the expected size, so that the end is met without another block.
  size_t room = sizeHint > 0 ? static_cast<size_t>(sizeHint) + 1 : kReadBlockBytes;
  size_t used = 0;
  for (;;) {
    text.resize(used + room);
    const ssize_t got = read(file, text.data() + used, room);
    if (got < 0 && errno != EINTR) {
      Fail(kErrorUnreadable);
      return false;
    }
    if (got == 0) {
      text.resize(used);
      return true;
    }
    used += got > 0 ? static_cast<size_t>(got) : 0;
    room = kReadBlockBytes;
  }
}

bool ReadWholeFile(const char* path, std::string& text) {
  struct stat status;
  const OwnedFd file = OpenForReading(path, status);
  return file && ReadToEnd(file.get(), status.st_size, text);
}

}  // namespace platform
