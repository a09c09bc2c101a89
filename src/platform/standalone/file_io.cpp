// Descriptors that close themselves, and files read and written whole.
#include "platform/standalone/file_io.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "platform/standalone/error_code.h"

namespace platform {
namespace {

constexpr size_t kReadBlockBytes = size_t{64} * 1024;

}  // namespace

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept {
  Reset(other.Release());
  return *this;
}

int Descriptor::Release() {
  const int fd = fd_;
  fd_ = -1;
  return fd;
}

void Descriptor::Reset(int fd) {
  if (fd_ >= 0 && fd_ != fd) {
    const int reason = errno;
    close(fd_);
    errno = reason;
  }
  fd_ = fd;
}

Descriptor OpenRegularFile(const char* path, struct stat* status) {
  Descriptor file(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) {
    Fail(errno == ENOENT || errno == ENOTDIR ? kErrorNotFound : kErrorUnreadable);
    return file;
  }
  if (fstat(file.get(), status) != 0) {
    Fail(kErrorUnreadable);
    return Descriptor();
  }
  if (!S_ISREG(status->st_mode)) {
    errno = S_ISDIR(status->st_mode) ? EISDIR : EINVAL;
    Fail(kErrorNotRegular);
    return Descriptor();
  }
  return file;
}

bool ReadToEnd(int fd, off_t sizeHint, std::string& text) {
  // One byte more than the expected size, so that the end is met without another block.
  size_t room = sizeHint > 0 ? static_cast<size_t>(sizeHint) + 1 : kReadBlockBytes;
  size_t used = 0;
  for (;;) {
    text.resize(used + room);
    const ssize_t got = read(fd, text.data() + used, room);
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
  const Descriptor file = OpenRegularFile(path, &status);
  return file && ReadToEnd(file.get(), status.st_size, text);
}

bool WriteAll(int fd, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(fd, text.data(), text.size());
    if (written < 0 && errno != EINTR) {
      return false;
    }
    text.remove_prefix(written > 0 ? static_cast<size_t>(written) : 0);
  }
  return true;
}

}  // namespace platform
