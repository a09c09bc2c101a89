// Files read whole, with the platform's last error set on failure.
#ifndef PLATFORM_STANDALONE_FILE_IO_H_
#define PLATFORM_STANDALONE_FILE_IO_H_

#include <sys/stat.h>

#include <string>

#include "base/file_io.h"

namespace platform {

using quendel::OwnedFd;

// Does what quendel::OpenRegularFile() does, and sets the last error on failure.
OwnedFd OpenForReading(const char* path, struct stat& status);

// Reads from the position of a file to its end, in large blocks; `sizeHint` saves allocations.
// Returns false with the last error set when a read fails; the end of a file is not a failure.
bool ReadToEnd(int file, off_t sizeHint, std::string& text);

// Reads a regular file whole. Returns false with the last error set on failure.
bool ReadWholeFile(const char* path, std::string& text);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_FILE_IO_H_
