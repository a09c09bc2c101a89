// Lines of files of any size and of any length, in constant memory.
#include "collectors/line_copy.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstring>
#include <limits>

#include "base/file_io.h"

namespace quendel {
namespace {

constexpr size_t kBlockBytes = 64 << 10;

int64_t FileSize(int file) {
  struct stat status;
  return fstat(file, &status) == 0 ? status.st_size : -1;
}

// Finds the end of the line that holds the byte at `from`: just past the first newline from there
// on, or the end of the file where there is none. Returns negative on failure.
int64_t FindLineEnd(int file, int64_t from) {
  char block[kBlockBytes];
  for (;;) {
    const ssize_t got = ReadAt(file, block, sizeof block, from);
    if (got <= 0) {
      return got < 0 ? -1 : from;
    }
    const void* newline = memchr(block, '\n', static_cast<size_t>(got));
    if (newline != nullptr) {
      return from + (static_cast<const char*>(newline) - block) + 1;
    }
    from += got;
  }
}

// Finds where the line begins that holds the byte before `end`. Returns its offset, negative on
// failure.
int64_t FindLineStart(int file, int64_t end) {
  char block[kBlockBytes];
  while (end > 0) {
    const int64_t count = std::min<int64_t>(end, sizeof block);
    const ssize_t got = ReadAt(file, block, count, end - count);
    if (got != count) {
      return -1;
    }
    const void* newline = memrchr(block, '\n', static_cast<size_t>(count));
    if (newline != nullptr) {
      return end - count + (static_cast<const char*>(newline) - block) + 1;
    }
    end -= count;
  }
  return 0;
}

// Adds the bytes from `begin` to `end`. Returns false when they cannot all be read.
bool AddBytes(int file, int64_t begin, int64_t end, Md5& md5) {
  char block[kBlockBytes];
  while (begin < end) {
    const ssize_t got = ReadAt(file, block, std::min<int64_t>(end - begin, sizeof block), begin);
    if (got <= 0) {
      return false;
    }
    md5.Add(block, static_cast<size_t>(got));
    begin += got;
  }
  return true;
}

}  // namespace

LineMark EmptyLine(int64_t end) {
  LineMark line = {};
  Md5().Finish(line.hash);
  line.end = end;
  return line;
}

ReadResult ReadLine(int file, int64_t start, LineMark& line) {
  char block[kBlockBytes];
  Md5 md5;
  int64_t end = start;
  bool hasNewline = false;
  while (!hasNewline) {
    const ssize_t got = ReadAt(file, block, sizeof block, end);
    if (got < 0) {
      return ReadResult::kError;
    }
    if (got == 0) {
      break;
    }
    const void* newline = memchr(block, '\n', static_cast<size_t>(got));
    hasNewline = newline != nullptr;
    const ssize_t text = hasNewline ? static_cast<const char*>(newline) - block : got;
    md5.Add(block, static_cast<size_t>(text));
    end += text;
  }
  if (end == start && !hasNewline) {
    return ReadResult::kNoLine;
  }
  md5.Finish(line.hash);
  line.length = end - start;
  line.end = end + (hasNewline ? 1 : 0);
  return ReadResult::kLine;
}

ReadResult ReadLastLine(int file, LineMark& line) {
  const int64_t size = FileSize(file);
  if (size <= 0) {
    return size < 0 ? ReadResult::kError : ReadResult::kNoLine;
  }
  char last = 0;
  if (ReadAt(file, &last, 1, size - 1) != 1) {
    return ReadResult::kError;
  }
  const int64_t end = last == '\n' ? size - 1 : size;
  const int64_t begin = FindLineStart(file, end);
  Md5 md5;
  if (begin < 0 || !AddBytes(file, begin, end, md5)) {
    return ReadResult::kError;
  }
  md5.Finish(line.hash);
  line.length = end - begin;
  line.end = size;
  return ReadResult::kLine;
}

int64_t CopyLines(int source, int64_t start, int64_t limit, int sink) {
  const int64_t end = FindLineEnd(source, std::max(start, limit - 1));
  if (end < 0) {
    return -1;
  }
  const int64_t copied = CopyRange(source, start, end, sink);
  if (copied <= 0) {
    return copied;
  }
  char last = 0;
  if (ReadAt(sink, &last, 1, copied - 1) != 1) {
    return -1;
  }
  return last == '\n' || WriteAll(sink, "\n") ? copied : -1;
}

bool CopyWhole(int source, int sink) {
  return CopyRange(source, 0, std::numeric_limits<int64_t>::max(), sink) >= 0;
}

}  // namespace quendel
