// Changing a file so that nobody ever sees half of the change.
#ifndef PLATFORM_STANDALONE_REPLACE_FILE_H_
#define PLATFORM_STANDALONE_REPLACE_FILE_H_

#include <functional>
#include <string>

#include "platform/standalone/file_io.h"

namespace platform {

// Keeps every other writer of one file away, in this process and in others, while it lives.
//
// The lock is held on a file of its own, beside the target and named ".<name>.lock", because the
// target itself is another file after each change. Whoever holds it removes it; what a killed
// process left behind is taken over.
class FileLock {
 public:
  // Waits for the lock, 10 s at most. The lock is false, with the last error set, when it could not
  // be taken.
  explicit FileLock(const std::string& target);
  ~FileLock();
  FileLock(const FileLock&) = delete;
  FileLock& operator=(const FileLock&) = delete;

  explicit operator bool() const { return static_cast<bool>(file_); }

 private:
  std::string path_;
  OwnedFd file_;
};

// Makes the new text of a file out of the old one.
using Change = std::function<std::string(const std::string& oldText)>;

// Changes an existing regular file under its lock: a reader, or a crash at any moment, finds the
// old text or the new one. A symbolic link is followed, and stays. Mode and owner are kept. A text
// that does not change is not written again, only synchronised. Returns 0 when the new text is on
// the disk, or -1 with the last error set.
int ChangeFile(const char* path, const Change& change);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_REPLACE_FILE_H_
