// Copying a file's contents by the shortest way that the file systems offer.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>

#include "platform/file.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

// Where a copy goes.
struct Destination {
  OwnedFd file;
  bool isNew = false;
};

// A hole has no data that would give the copy its size.
bool EndWithHole(int from, off_t size, int to) {
  struct stat status;
  return fstat(from, &status) == 0 && ftruncate(to, std::min(size, status.st_size)) == 0;
}

// Copies the bytes from one offset up to another to where they came from. Returns how many there
// were, negative with errno set on failure.
int64_t CopyData(int from, off_t begin, off_t end, int to) {
  return lseek(to, begin, SEEK_SET) < 0 ? -1 : quendel::CopyRange(from, begin, end, to);
}

// Copies the first `size` bytes, or what is there when the source shrinks meanwhile. Returns false
// with errno set on failure.
bool CopyAroundHoles(int from, off_t size, int to) {
  for (off_t position = 0; position < size;) {
    const off_t data = lseek(from, position, SEEK_DATA);
    if (data >= size || (data < 0 && errno == ENXIO)) {
      return EndWithHole(from, size, to);
    }
    // To a file system that knows no holes everything is data.
    const off_t begin = data < 0 ? position : data;
    const off_t hole = data < 0 ? size : lseek(from, data, SEEK_HOLE);
    const off_t end = hole < 0 ? size : std::min(hole, size);
    const int64_t copied = CopyData(from, begin, end, to);
    if (copied < end - begin) {
      return copied >= 0;
    }
    position = end;
  }
  return true;
}

Destination OpenDestination(const char* path, mode_t mode) {
  constexpr int kFlags = O_WRONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
  Destination destination;
  destination.file = OwnedFd(open(path, kFlags | O_CREAT | O_EXCL, mode));
  destination.isNew = static_cast<bool>(destination.file);
  if (!destination.file && errno == EEXIST) {
    destination.file = OwnedFd(open(path, kFlags));
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

// A file that does not tell its size, as those of /proc, is copied to its end.
bool CopyContents(int from, const struct stat& source, int to) {
  if (ftruncate(to, 0) != 0) {
    return false;
  }
  return source.st_size > 0 ? CopyAroundHoles(from, source.st_size, to)
                            : CopyData(from, 0, std::numeric_limits<off_t>::max(), to) >= 0;
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
  const OwnedFd from = OpenForReading(src, source);
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
