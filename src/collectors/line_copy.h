// Lines of files of any size and of any length, in constant memory.
//
// A line is what stands between two newlines, whatever its bytes are; what follows the last newline
// is a line too, unless it is empty. Offsets and lengths are in bytes.
#ifndef COLLECTORS_LINE_COPY_H_
#define COLLECTORS_LINE_COPY_H_

#include <cstdint>

#include "base/md5.h"

namespace quendel {

// What is remembered of a line that was read.
struct LineMark {
  char hash[Md5::kTextBytes];  // MD5 text of the line, without its newline
  int64_t length;              // without its newline
  int64_t end;                 // offset just past it, with its newline where it has one
};

// The empty line that ends at an offset.
LineMark EmptyLine(int64_t end);

enum class ReadResult { kLine, kNoLine, kError };

// Reads the line that begins at `start`. There is none at the end of the file or behind it.
ReadResult ReadLine(int file, int64_t start, LineMark& line);

// Reads the last line of the file, looking from its end. There is none in an empty file.
ReadResult ReadLastLine(int file, LineMark& line);

// Appends to the empty file `sink` the lines of `source` from `start` on: at least one where there
// is one, then up to and including the first that ends at or behind `limit`. A last line that has
// no newline yet gets one in the sink. Returns how many bytes of the source were taken, negative on
// failure.
int64_t CopyLines(int source, int64_t start, int64_t limit, int sink);

// Appends the whole of `source` to `sink`, whose position is its end. Returns false on failure.
bool CopyWhole(int source, int sink);

}  // namespace quendel

#endif  // COLLECTORS_LINE_COPY_H_
