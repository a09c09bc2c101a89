// What tells one file from another.
#ifndef PLATFORM_STANDALONE_FILE_IDENTITY_H_
#define PLATFORM_STANDALONE_FILE_IDENTITY_H_

#include <sys/stat.h>

#include <cstdint>

namespace platform {

// Mixes a file's inode number and the time of its birth into 32 bits, never 0. Two files of one
// number that were born within one tick of the clock are one.
uint32_t MixIdentity(uint64_t inode, int64_t birthSeconds, uint32_t birthNanoseconds);

// Gives what stat() tells of a path. Where the device's settings ask for it, with
// "file_identity=birth", the inode number is a mixed one, as a file system may give the number of a
// file that is gone to the next one; a file without a time of birth keeps its number, and the first
// of them is logged. Returns 0, or -1 with the last error set.
int StatWithIdentity(const char* path, struct stat& status);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_FILE_IDENTITY_H_
