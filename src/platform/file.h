// The platform's file operations.
#ifndef PLATFORM_FILE_H_
#define PLATFORM_FILE_H_

extern "C" {

// Returns 1 when the path exists, whatever it is, else 0. A link to nothing does not exist.
int ALIBCFileExist(const char* path);

// Returns 1 when the path is a directory, or a link to one; 0 when it is something else or does not
// exist; negative when that cannot be told.
int ALIBCFileCheckDir(const char* path);

// Releases a file lock of the whole platform that this process may hold, named by its number. A
// lock that is not held is no failure. Returns 0, or negative on failure.
int ALIBCFileUnlock(int lockId);
}

#endif  // PLATFORM_FILE_H_
