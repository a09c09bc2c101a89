// Listing and creating directories.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "platform/file.h"
#include "platform/standalone/container.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr mode_t kPrivateMode = 0700;
constexpr unsigned int kModeBits = 07777;

// What a created directory gets.
struct Ownership {
  uid_t uid;  // -1 leaves it
  gid_t gid;  // -1 leaves it
  mode_t mode;
};

// A link counts as what it leads to; one that leads nowhere is no file.
bool IsRegularFile(int directory, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN && entry.d_type != DT_LNK) {
    return entry.d_type == DT_REG;
  }
  struct stat status;
  return fstatat(directory, entry.d_name, &status, 0) == 0 && S_ISREG(status.st_mode);
}

bool IsListed(int directory, const dirent& entry, const char* prefix) {
  return entry.d_name[0] != '.' && strncmp(entry.d_name, prefix, strlen(prefix)) == 0 &&
         IsRegularFile(directory, entry);
}

bool ListFiles(const char* dir, const char* prefix, std::vector<std::string>& names) {
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(dir), closedir);
  if (!stream) {
    Fail(errno == ENOENT || errno == ENOTDIR ? kErrorNotFound : kErrorUnreadable);
    return false;
  }
  for (;;) {
    errno = 0;
    const dirent* const entry = readdir(stream.get());
    if (entry == nullptr) {
      break;
    }
    if (IsListed(dirfd(stream.get()), *entry, prefix)) {
      names.emplace_back(entry->d_name);
    }
  }
  if (errno != 0) {
    Fail(kErrorUnreadable);
    return false;
  }
  std::sort(names.begin(), names.end());
  return true;
}

// Nobody but us can use a directory before it has its owner and mode.
OwnedFd CreateDirectory(int parent, const char* name, const Ownership& ownership) {
  if (mkdirat(parent, name, kPrivateMode) != 0) {
    return OwnedFd();
  }
  OwnedFd created(openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  constexpr auto kKeep = static_cast<unsigned int>(-1);
  const bool changesOwner = ownership.uid != kKeep || ownership.gid != kKeep;
  if (created && changesOwner && fchown(created.get(), ownership.uid, ownership.gid) != 0) {
    return OwnedFd();
  }
  if (created && fchmod(created.get(), ownership.mode) != 0) {
    return OwnedFd();
  }
  return created;
}

// Returns a descriptor that is false with errno set when the directory is neither there nor made.
OwnedFd EnterOrCreate(int parent, const char* name, const Ownership& ownership) {
  constexpr int kEnter = O_PATH | O_DIRECTORY | O_CLOEXEC;
  OwnedFd entered(openat(parent, name, kEnter));
  if (entered || errno != ENOENT) {
    return entered;
  }
  OwnedFd created = CreateDirectory(parent, name, ownership);
  if (created || errno != EEXIST) {
    return created;
  }
  return OwnedFd(openat(parent, name, kEnter));  // somebody else was faster
}

int MakePath(const std::string& path, const Ownership& ownership) {
  OwnedFd current(open(path[0] == '/' ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
  for (size_t begin = 0; current && begin < path.size();) {
    const size_t end = std::min(path.find('/', begin), path.size());
    if (end > begin) {
      const std::string name = path.substr(begin, end - begin);
      current = EnterOrCreate(current.get(), name.c_str(), ownership);
    }
    begin = end + 1;
  }
  return current ? 0 : Fail(kErrorWriteFailed);
}

}  // namespace
}  // namespace platform

int ALIBCFileEnumDir(const char* dir, const char* prefix, ALIBSZLIST** names, int flags) try {
  if (dir == nullptr || prefix == nullptr || names == nullptr || *names == nullptr ||
      flags != platform::kEnumRegularFiles) {
    return platform::FailForArgument();
  }
  std::vector<std::string> found;
  if (!platform::ListFiles(dir, prefix, found)) {
    return -1;
  }
  std::vector<std::string>& texts = (*names)->texts;
  texts.insert(texts.end(), found.begin(), found.end());
  return static_cast<int>(found.size());
} catch (...) {
  return platform::FailForException();
}

int ARVOFSMkdirP(const char* path, int /*flag*/, int /*parents*/, int uid, int gid,
                 unsigned int mode) try {
  if (path == nullptr || path[0] == '\0') {
    return platform::FailForArgument();
  }
  const platform::Ownership ownership = {static_cast<uid_t>(uid), static_cast<gid_t>(gid),
                                         static_cast<mode_t>(mode & platform::kModeBits)};
  return platform::MakePath(path, ownership);
} catch (...) {
  return platform::FailForException();
}
