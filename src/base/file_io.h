// Files by their descriptors: opened for reading, read, written and copied.
//
// Whatever fails has set errno. A call that a signal interrupts goes on.
#ifndef BASE_FILE_IO_H_
#define BASE_FILE_IO_H_

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <string_view>

#include "base/owned_fd.h"

namespace quendel {

// Tells whether a call that failed with this errno has told that there is nothing at the path. Any
// other error says nothing about what is there.
bool IsAbsence(int error);

// Opens a regular file for reading. Anything else is refused, with EISDIR or EINVAL, and never
// waited for: a FIFO would keep its reader until somebody writes. `status` gets what fstat() tells
// of the open file. Returns no descriptor on failure.
OwnedFd OpenRegularFile(const char* path, struct stat& status);

// Reads `count` bytes at an offset, or those up to the end of the file. Returns how many there
// were, negative on failure.
ssize_t ReadAt(int file, char* buffer, int64_t count, int64_t offset);

// Writes everything, however many calls that takes. Returns false on failure.
bool WriteAll(int file, std::string_view bytes);

// Copies the bytes from `begin` to `end`, or to the end of the source where that comes first, to
// the position of the sink, by the shortest way that the two file systems offer. The sink must not
// be open for appending. Returns how many were copied, negative on failure.
int64_t CopyRange(int source, int64_t begin, int64_t end, int sink);

}  // namespace quendel

#endif  // BASE_FILE_IO_H_
