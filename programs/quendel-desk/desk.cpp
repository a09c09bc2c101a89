// What the parts of a running desk share.
#include "desk.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <system_error>

#include "access_log.h"

namespace quendeldesk {
namespace {

constexpr size_t kFileThreads = 4;
constexpr size_t kLookupThreads = 2;
constexpr size_t kQueryThreads = 2;
constexpr size_t kReaders = kLookupThreads + kQueryThreads + 1;

std::string MadeFolder(const std::string& folder) {
  if (mkdir(folder.c_str(), 0700) != 0 && errno != EEXIST) {
    throw std::system_error(errno, std::generic_category(), "cannot make " + folder);
  }
  return folder;
}

}  // namespace

Archive::Archive(const std::string& path)
    : folder(MadeFolder(path)),
      objects(OpenFolderObjects(path + "/files")),
      store(path + "/desk.db", kReaders) {
  const Descriptor opened(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!opened || fsync(opened.get()) != 0) {
    throw std::system_error(errno, std::generic_category(), "cannot write " + path);
  }
}

void Archive::Recover() {
  for (const std::string& object : objects->Unsettled()) {
    const bool named = store.Read([&](soci::session& s) { return IsNamed(s, object); });
    if (named) {
      objects->Settle(object);
    } else {
      objects->Remove(object);
      LogLine("removed a file that had not been acknowledged: " + object);
    }
  }
  RemoveDiscarded();
}

void Archive::RemoveDiscarded() {
  for (const std::string& object : store.Read(Discarded)) {
    objects->Remove(object);
    store.WriteAndWait([&object](soci::session& session) { NoteRemoved(session, object); });
  }
}

Desk::Desk(const Settings& s)
    : settings(s),
      archive(s.data),
      files(kFileThreads),
      lookups(kLookupThreads),
      queries(kQueryThreads),
      per_device(s.per_device),
      per_address(s.per_address) {
}

}  // namespace quendeldesk
