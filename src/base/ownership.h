// Whether what lies at a path below "/tmp", where everybody makes what he likes, is ours.
//
// What is ours stays ours. "/tmp" has its sticky bit, so nobody else renames or removes an entry of
// ours there; and a directory that was found to be ours is nobody else's to write to.
#ifndef BASE_OWNERSHIP_H_
#define BASE_OWNERSHIP_H_

namespace quendel {

// Tells whether the path is no link and belongs to the effective user. A directory that its group
// or others may write to is closed to them first: it gets mode 0700.
bool IsOurs(const char* path);

// The same of a directory, and of nothing else.
bool IsOurDirectory(const char* path);

// Tells whether the path is a regular file of ours, with no other name somewhere else, or nothing.
// Its directory is to be ours.
bool IsOurFileOrNothing(const char* path);

}  // namespace quendel

#endif  // BASE_OWNERSHIP_H_
