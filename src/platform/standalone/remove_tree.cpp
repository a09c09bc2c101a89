// Removing a directory with everything below it.
//
// Only descriptors and single names are used, never a path of several components: nobody who moves
// directories about meanwhile can lead the removal out of the tree. Depth costs memory, but neither
// stack nor descriptors.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/file.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr int kOpenDirectory = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

// Which directory this is, and by which mount it is seen: a folder that is mounted a second time is
// the same directory there, but nothing that belongs to the tree.
struct Place {
  dev_t device;
  uint64_t inode;
  uint64_t mount;  // 0 where the kernel does not tell, before Linux 5.8

  bool operator==(const Place& other) const {
    return device == other.device && inode == other.inode && mount == other.mount;
  }
};

// A directory on the way down from the top of the tree.
struct Level {
  std::string name;  // in the directory above
  Place place;
  std::vector<std::string> directories;  // those directly below that are still to be removed
};

class TreeRemoval {
 public:
  // Removes what is below a directory. Returns 0, or the error number of the first thing that
  // stayed.
  int Empty(OwnedFd top);

 private:
  void Note(int error) { firstError_ = firstError_ == 0 ? error : firstError_; }
  void Enter(const std::string& name, OwnedFd directory);
  void RemoveEntries(Level& level);
  void Leave();

  int firstError_ = 0;
  OwnedFd current_;
  std::vector<Level> levels_;
};

// Returns false with errno set on failure.
bool FindPlace(const OwnedFd& directory, Place& place) {
  struct statx status;
  if (!directory ||
      statx(directory.get(), "", AT_EMPTY_PATH, STATX_INO | STATX_MNT_ID, &status) != 0) {
    return false;
  }
  place.device = makedev(status.stx_dev_major, status.stx_dev_minor);
  place.inode = status.stx_ino;
  place.mount = (status.stx_mask & STATX_MNT_ID) != 0 ? status.stx_mnt_id : 0;
  return true;
}

bool IsDotName(const std::string& name) {
  return name == "." || name == "..";
}

// Returns 0, or an error number with the names that could be read.
int ReadNames(int directory, std::vector<std::string>& names) {
  // The stream takes a descriptor over, and the directory's own is needed longer.
  OwnedFd copy(openat(directory, ".", kOpenDirectory));
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(copy ? fdopendir(copy.get()) : nullptr,
                                                   closedir);
  if (!stream) {
    return errno;
  }
  copy.Release();
  for (;;) {
    errno = 0;
    const dirent* const entry = readdir(stream.get());
    if (entry == nullptr) {
      return errno;
    }
    if (!IsDotName(entry->d_name)) {
      names.emplace_back(entry->d_name);
    }
  }
}

// Removes all but the directories, which are left for later. All names are read before the first is
// removed: not every file system keeps its place in a directory that shrinks.
void TreeRemoval::RemoveEntries(Level& level) {
  std::vector<std::string> names;
  if (const int error = ReadNames(current_.get(), names); error != 0) {
    Note(error);
  }
  for (std::string& name : names) {
    if (unlinkat(current_.get(), name.c_str(), 0) == 0 || errno == ENOENT) {
      continue;
    }
    if (errno == EISDIR) {
      level.directories.push_back(std::move(name));
    } else {
      Note(errno);
    }
  }
}

void TreeRemoval::Enter(const std::string& name, OwnedFd directory) {
  if (!directory && errno == ENOENT) {
    return;  // somebody else was faster
  }
  Place place = {};
  if (!FindPlace(directory, place)) {
    Note(errno);
    return;
  }
  if (!levels_.empty() &&
      (place.device != levels_.back().place.device || place.mount != levels_.back().place.mount)) {
    // Something is mounted here: what it holds is not part of the tree.
    Note(EBUSY);
    return;
  }
  current_ = std::move(directory);
  levels_.push_back({name, place, {}});
  RemoveEntries(levels_.back());
}

// Goes up one level and removes the directory that was left.
void TreeRemoval::Leave() {
  const std::string name = levels_.back().name;
  levels_.pop_back();
  if (levels_.empty()) {
    return;
  }
  OwnedFd above(openat(current_.get(), "..", kOpenDirectory));
  Place place = {};
  if (!FindPlace(above, place) || !(place == levels_.back().place)) {
    // Somebody moved the directory: nothing tells any more where this is.
    Note(above ? ESTALE : errno);
    levels_.clear();
    return;
  }
  current_ = std::move(above);
  if (unlinkat(current_.get(), name.c_str(), AT_REMOVEDIR) != 0 && errno != ENOENT) {
    Note(errno);
  }
}

int TreeRemoval::Empty(OwnedFd top) {
  Enter(std::string(), std::move(top));
  while (!levels_.empty()) {
    std::vector<std::string>& directories = levels_.back().directories;
    if (directories.empty()) {
      Leave();
      continue;
    }
    const std::string name = std::move(directories.back());
    directories.pop_back();
    Enter(name, OwnedFd(openat(current_.get(), name.c_str(), kOpenDirectory)));
  }
  return firstError_;
}

// A slash at the end would have a link followed.
std::string WithoutSlashesAtEnd(std::string path) {
  path.resize(path.find_last_not_of('/') + 1);
  return path;
}

// A directory that cannot be removed by its name must not be emptied either.
bool HasNameToRemove(const std::string& path) {
  return !path.empty() && !IsDotName(path.substr(path.rfind('/') + 1));
}

int RemoveTree(const std::string& path) {
  OwnedFd top(open(path.c_str(), kOpenDirectory));
  if (!top) {
    return Fail(errno == ENOENT || errno == ENOTDIR ? kErrorNotFound : kErrorUnreadable);
  }
  const int error = TreeRemoval().Empty(std::move(top));
  const bool isRemoved = rmdir(path.c_str()) == 0;
  if (error == 0 && isRemoved) {
    return 0;
  }
  errno = error != 0 ? error : errno;
  return Fail(kErrorRemoveFailed);
}

}  // namespace
}  // namespace platform

int ALIBCopyRemoveDir(const char* path) try {
  if (path == nullptr) {
    return platform::FailForArgument();
  }
  const std::string top = platform::WithoutSlashesAtEnd(path);
  return platform::HasNameToRemove(top) ? platform::RemoveTree(top) : platform::FailForArgument();
} catch (...) {
  return platform::FailForException();
}
