// Files by their descriptors: opened for reading, read, written and copied.
#include "base/file_io.h"

#include <fcntl.h>
#include <sys/sendfile.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace quendel {
namespace {

constexpr size_t kBlockBytes = 64 << 10;

// The most that one call to the kernel is asked to move.
constexpr int64_t kMostMovedBytes = 1 << 30;

// One way to move bytes from an offset of one file to the position of another. Returns how many
// were moved, 0 at the end of the source, negative on failure.
using Move = ssize_t (*)(int source, off_t& offset, int64_t count, int sink);

// Shares the blocks where the file system can, and copies inside the kernel where it cannot.
ssize_t MoveByRange(int source, off_t& offset, int64_t count, int sink) {
  return copy_file_range(source, &offset, sink, nullptr, static_cast<size_t>(count), 0);
}

// Between two file systems.
ssize_t MoveBySendfile(int source, off_t& offset, int64_t count, int sink) {
  return sendfile(sink, source, &offset, static_cast<size_t>(count));
}

ssize_t MoveByHand(int source, off_t& offset, int64_t count, int sink) {
  char block[kBlockBytes];
  const ssize_t got = ReadAt(source, block, std::min<int64_t>(count, sizeof block), offset);
  if (got <= 0) {
    return got;
  }
  if (!WriteAll(sink, {block, static_cast<size_t>(got)})) {
    return -1;
  }
  offset += got;
  return got;
}

}  // namespace

bool IsAbsence(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP || error == ENAMETOOLONG;
}

OwnedFd OpenRegularFile(const char* path, struct stat& status) {
  OwnedFd file(open(path, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!file || fstat(file.get(), &status) != 0) {
    return OwnedFd();
  }
  if (!S_ISREG(status.st_mode)) {
    errno = S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
    return OwnedFd();
  }
  return file;
}

ssize_t ReadAt(int file, char* buffer, int64_t count, int64_t offset) {
  ssize_t done = 0;
  while (done < count) {
    const ssize_t got =
        pread(file, buffer + done, static_cast<size_t>(count - done), offset + done);
    if (got == 0) {
      break;
    }
    if (got < 0 && errno != EINTR) {
      return -1;
    }
    done += std::max<ssize_t>(got, 0);
  }
  return done;
}

bool WriteAll(int file, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = write(file, bytes.data(), bytes.size());
    if (written < 0 && errno != EINTR) {
      return false;
    }
    bytes.remove_prefix(static_cast<size_t>(std::max<ssize_t>(written, 0)));
  }
  return true;
}

// Some file systems answer 0 for files that can be read all the same, and which errors mean "not
// between these two" differs from one to the next. So what one way of moving bytes does not do is
// left to the next, and the last one, reading and writing, tells what is a failure.
int64_t CopyRange(int source, int64_t begin, int64_t end, int sink) {
  off_t offset = begin;
  ssize_t moved = 0;
  for (const Move move : {MoveByRange, MoveBySendfile, MoveByHand}) {
    do {
      if (offset == end) {
        return end - begin;
      }
      moved = move(source, offset, std::min<int64_t>(end - offset, kMostMovedBytes), sink);
    } while (moved > 0 || (moved < 0 && errno == EINTR));
  }
  return moved < 0 ? -1 : offset - begin;
}

}  // namespace quendel
