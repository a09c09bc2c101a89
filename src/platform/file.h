// The platform's file operations.
#ifndef PLATFORM_FILE_H_
#define PLATFORM_FILE_H_

struct ALIBSZLIST;
struct stat;

namespace platform {

// What a listing takes for "regular files, or links to one", the only kind that is asked for.
constexpr int kEnumRegularFiles = 130;

}  // namespace platform

extern "C" {

// Returns 1 when the path exists, whatever it is; 0 when it does not, as a link to nothing;
// negative when that cannot be told.
int ALIBCFileExist(const char* path);

// Returns 1 when the path is a directory, or a link to one; 0 when it is something else or does not
// exist; negative when that cannot be told.
int ALIBCFileCheckDir(const char* path);

// Releases a file lock of the whole platform that this process may hold, named by its number. A
// lock that is not held is no failure. Returns 0, or negative on failure.
int ALIBCFileUnlock(int lockId);

// Appends to a list the names, without the directory, of the directory's entries that begin with
// `prefix`, in ascending order by byte value. `flags` is platform::kEnumRegularFiles. A name that
// begins with a dot is never listed. Returns the number of names, negative on failure with the list
// as it was.
int ALIBCFileEnumDir(const char* dir, const char* prefix, ALIBSZLIST** names, int flags);

// Gives what stat() tells of a path; the inode number is what tells the file from others, of which
// a collected log's record keeps the low 32 bits. `flags` is always 1: links are followed. Returns
// 0, or negative on failure.
int ALIBCFileStat(const char* path, int flags, struct stat* status);

// Creates an empty file, mode 0644 less the umask, or sets the times of what is there to now. A
// link to nothing is a failure. Returns 0, or negative on failure.
int ALIBCFileTouch(const char* path);

// Removes a directory and everything below it, at any depth. No symbolic link is followed, neither
// below nor as the path itself, and nothing that is mounted below is entered, be it of the same
// file system. What can be removed is removed even when something cannot. Returns 0 when nothing is
// left, negative on failure with errno of the first thing that stayed.
int ALIBCopyRemoveDir(const char* path);

// Copies the contents of a regular file to dst, which is created with the permissions of src, less
// the umask, or truncated. Any size; holes stay holes; what is appended to src meanwhile is left
// out, and a source that shrinks gives what was there. A FIFO, device or directory on either side,
// and one file under both names, is refused at once with dst as it was. `options` points to 80
// bytes of the vendor's own flags, which change nothing here; null is allowed. Returns 0, or
// negative on failure: a dst that was created is then gone, one that was there before is empty.
int ARVOFileCopy(const char* src, const char* dst, const void* options);

// Creates a directory and its missing parents. Each one that is created gets exactly this mode, and
// this owner and group unless they are -1; one that is there keeps its own. The two flags are
// always 0 and 1. Returns 0, or negative on failure.
int ARVOFSMkdirP(const char* path, int flag, int parents, int uid, int gid, unsigned int mode);
}

#endif  // PLATFORM_FILE_H_
