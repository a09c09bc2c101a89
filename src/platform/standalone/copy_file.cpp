// Copying a file's contents by the shortest way that the file systems offer.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <memory>

#include "platform/file.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr size_t kBlockBytes = size_t{256} * 1024;
constexpr size_t kMaxKernelCopyBytes = size_t{1} << 30;

// Where a copy goes.
struct Destination {
  Descriptor file;
  bool isNew = false;
};

// Copies between two open files, each byte to the offset that it came from.
class ContentsCopy {
 public:
  ContentsCopy(int from, int to) : from_(from), to_(to) {}

  // Copies the first `size` bytes, or what is there when the source shrinks meanwhile. Returns
  // false with errno set on failure.
  bool Copy(off_t size);

  // Copies all there is of a file that does not tell its size, as those of /proc.
  bool CopyToEnd() { return CopyData(std::numeric_limits<off_t>::max()); }

 private:
  bool CopyData(off_t end);
  ssize_t CopyPiece(size_t bytes);
  ssize_t CopyBlock(size_t bytes);
  bool EndWithHole(off_t size);

  const int from_;
  const int to_;
  off_t position_ = 0;
  bool isKernelAble_ = true;
  std::unique_ptr<char[]> block_;
};

ssize_t ContentsCopy::CopyBlock(size_t bytes) {
  if (!block_) {
    block_ = std::make_unique<char[]>(kBlockBytes);
  }
  const ssize_t got = pread(from_, block_.get(), std::min(bytes, kBlockBytes), position_);
  return got < 1 ? got : pwrite(to_, block_.get(), static_cast<size_t>(got), position_);
}

// Returns the number of bytes copied, 0 at the end of the source, -1 with errno set on failure.
ssize_t ContentsCopy::CopyPiece(size_t bytes) {
  if (isKernelAble_) {
    off_t from = position_;
    off_t to = position_;
    const ssize_t copied =
        copy_file_range(from_, &from, to_, &to, std::min(bytes, kMaxKernelCopyBytes), 0);
    if (copied > 0) {
      return copied;
    }
    // Some file systems answer 0 for files that can be read all the same, and which errors mean
    // "not between these two" differs from one to the next: reading and writing tells the truth.
    isKernelAble_ = false;
  }
  return CopyBlock(bytes);
}

// Copies from the position up to an offset, or to the end of the source when that comes first.
bool ContentsCopy::CopyData(off_t end) {
  while (position_ < end) {
    const ssize_t copied = CopyPiece(static_cast<size_t>(end - position_));
    if (copied == 0) {
      return true;
    }
    if (copied < 0 && errno != EINTR) {
      return false;
    }
    position_ += std::max<ssize_t>(copied, 0);
  }
  return true;
}

// A hole has no data that would give the copy its size.
bool ContentsCopy::EndWithHole(off_t size) {
  struct stat status;
  return fstat(from_, &status) == 0 && ftruncate(to_, std::min(size, status.st_size)) == 0;
}

bool ContentsCopy::Copy(off_t size) {
  while (position_ < size) {
    const off_t data = lseek(from_, position_, SEEK_DATA);
    if (data >= size || (data < 0 && errno == ENXIO)) {
      return EndWithHole(size);
    }
    // To a file system that knows no holes everything is data.
    const off_t hole = data < 0 ? size : lseek(from_, data, SEEK_HOLE);
    const off_t end = hole < 0 ? size : std::min(hole, size);
    position_ = std::max(data, position_);
    if (!CopyData(end)) {
      return false;
    }
    if (position_ < end) {
      return true;
    }
  }
  return true;
}

Destination OpenDestination(const char* path, mode_t mode) {
  constexpr int kFlags = O_WRONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
  Destination destination;
  destination.file.Reset(open(path, kFlags | O_CREAT | O_EXCL, mode));
  destination.isNew = static_cast<bool>(destination.file);
  if (!destination.file && errno == EEXIST) {
    destination.file.Reset(open(path, kFlags));
  }
  return destination;
}

// Tells whether a file that was there before may be overwritten.
bool IsOverwritable(int fd, const struct stat& source) {
  struct stat status;
  if (fstat(fd, &status) != 0) {
    Fail(kErrorUnreadable);
    return false;
  }
  const bool isSource = status.st_dev == source.st_dev && status.st_ino == source.st_ino;
  if (!S_ISREG(status.st_mode) || isSource) {
    errno = EINVAL;
    Fail(isSource ? kErrorBadArgument : kErrorNotRegular);
    return false;
  }
  return true;
}

bool CopyContents(int from, const struct stat& source, int to) {
  ContentsCopy copy(from, to);
  return ftruncate(to, 0) == 0 &&
         (source.st_size > 0 ? copy.Copy(source.st_size) : copy.CopyToEnd());
}

// What a failed copy leaves is nothing that could be taken for the file.
void Discard(const Destination& destination, const char* path) {
  const int reason = errno;
  if (destination.isNew) {
    unlink(path);
  } else if (ftruncate(destination.file.get(), 0) != 0) {
    // The copy failed already: there is nothing more to tell, or to do.
  }
  errno = reason;
}

int CopyFile(const char* src, const char* dst) {
  struct stat source;
  const Descriptor from = OpenRegularFile(src, &source);
  if (!from) {
    return -1;
  }
  const Destination destination = OpenDestination(dst, source.st_mode & 0777);
  if (!destination.file) {
    return Fail(kErrorWriteFailed);
  }
  if (!destination.isNew && !IsOverwritable(destination.file.get(), source)) {
    return -1;
  }
  if (!CopyContents(from.get(), source, destination.file.get())) {
    Discard(destination, dst);
    return Fail(kErrorWriteFailed);
  }
  return 0;
}

}  // namespace
}  // namespace platform

int ARVOFileCopy(const char* src, const char* dst, const void* /*options*/) try {
  if (src == nullptr || dst == nullptr) {
    return platform::FailForArgument();
  }
  return platform::CopyFile(src, dst);
} catch (...) {
  return platform::FailForException();
}
