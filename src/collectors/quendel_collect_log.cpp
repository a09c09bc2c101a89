// Collects what the configured logs have gained, across their rotations.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#include "base/file_io.h"
#include "base/log.h"
#include "base/paths.h"
#include "collectors/line_copy.h"
#include "collectors/staged_state.h"
#include "platform/file.h"
#include "platform/owned.h"
#include "platform/process.h"
#include "quendel/collectors.h"
#include "quendel/conf.h"

namespace quendel {
namespace {

using platform::OwnedHash;
using platform::OwnedList;

constexpr char kLogUnit[] = "quendel_collect_log";

constexpr int kListSize = 512;
constexpr int kStagedHashSize = 256;

using Path = char[256];

struct FreeRecord {
  void operator()(QUENDELLogConf_t* record) const { free(record); }
};
using OwnedRecord = std::unique_ptr<QUENDELLogConf_t, FreeRecord>;

// One log under collection.
struct LogTask {
  const char* conf;  // path of its configuration file
  const char* dst_dir;
  const QUENDELLogConf_t* record;
  OwnedHash* staged;  // its new state
  Path output;        // the file that what is collected goes to
};

enum class DiffResult { kDone, kCannotContinue, kError };

// What became of a live log.
enum class LiveResult {
  kFailed,
  kNothingNew,
  kContinued,  // the file of last time: its new lines, or all of it where it was rewritten
  kReplaced    // another file under the log's name, collected whole
};

// Builds "<log>.<number>.xz". Returns false when the name does not fit: cut, it would name another
// file.
bool BuildArchivePath(Path& path, const char* log, int number) {
  const int length = snprintf(path, sizeof path, "%s.%d.xz", log, number);
  return length >= 0 && static_cast<size_t>(length) < sizeof path;
}

bool BuildCopyPath(Path& path, const LogTask& task, int number) {
  const int length =
      snprintf(path, sizeof path, "%s/%s.%d.xz", task.dst_dir, task.record->name, number);
  return length >= 0 && static_cast<size_t>(length) < sizeof path;
}

// Tells whether there is nothing at a path. A file that cannot be examined is not missing: its
// lines would be overwritten or passed over. A platform may tell the two apart or not, so that its
// "no" counts only when the file system itself says the same.
bool IsMissing(const char* path) {
  struct stat status = {};
  return ALIBCFileExist(path) == 0 && stat(path, &status) != 0 && IsAbsence(errno);
}

void RemoveIfExists(const char* path) {
  if (ALIBCFileExist(path) != 0 && remove(path) != 0) {
    QUENDEL_LOG("Failed to remove %s [errno=%d]", path, errno);
  }
}

bool StageValue(const LogTask& task, const char* key, const char* value) {
  if (ALIBCSzHashSetValue(task.staged->slot(), key, value) < 0) {
    QUENDEL_LOG("Failed to set key-value pair (%s, %s) of conf '%s'", key, value, task.conf);
    return false;
  }
  return true;
}

bool StageLogState(const LogTask& task, const LineMark& last, int64_t total) {
  if (!StageValue(task, "last_hash", last.hash)) {
    return false;
  }
  char number[64] = {};
  snprintf(number, sizeof number, "%" PRId64, total);
  if (!StageValue(task, "total_byte", number)) {
    return false;
  }
  snprintf(number, sizeof number, "%" PRId64, last.length);
  return StageValue(task, "last_byte", number);
}

// Whether the last line collected stands in the source where the record expects it. `found`
// receives it then.
DiffResult FindLastCollected(const LogTask& task, const char* source, int file, int64_t size,
                             LineMark& found) {
  // After a reset this is -1, where no line can be read: the log cannot be continued, and says so.
  const int64_t start = task.record->total_byte - task.record->last_byte - 1;
  if (size < start) {
    return DiffResult::kCannotContinue;
  }
  if (start < 0 || ReadLine(file, start, found) != ReadResult::kLine) {
    QUENDEL_LOG("Failed to read hash line in log '%s'", source);
    return DiffResult::kError;
  }
  return strcmp(found.hash, task.record->last_hash) == 0 ? DiffResult::kDone
                                                         : DiffResult::kCannotContinue;
}

// Copies the lines that follow the last one collected, as far as `limit`.
DiffResult CopyDiff(const LogTask& task, const char* source, int64_t limit) {
  struct stat status = {};
  const OwnedFd in = OpenRegularFile(source, status);
  if (!in) {
    QUENDEL_LOG("Failed to open file '%s'", source);
    return DiffResult::kError;
  }
  LineMark last;
  const DiffResult found = FindLastCollected(task, source, in.get(), status.st_size, last);
  if (found != DiffResult::kDone) {
    return found;
  }
  // Deliberate: what the archive step put here goes. Only a whole copy adds to an output.
  OwnedFd out(open(task.output, O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0666));
  if (!out) {
    QUENDEL_LOG("Failed to open file '%s'", task.output);
    return DiffResult::kError;
  }
  const int64_t start = last.end;
  const int64_t copied = CopyLines(in.get(), start, limit, out.get());
  if (copied > 0 && ReadLastLine(out.get(), last) != ReadResult::kLine) {
    return DiffResult::kError;
  }
  if (copied < 0 || !out.Close()) {
    return DiffResult::kError;
  }
  // Without a new line the state becomes the empty line in front of the end.
  if (copied == 0) {
    last = EmptyLine(status.st_size);
  }
  if (!StageLogState(task, last, copied == 0 ? status.st_size : start + copied)) {
    QUENDEL_LOG("Failed to update config of log '%s'", source);
    return DiffResult::kError;
  }
  return DiffResult::kDone;
}

// Appends the snapshot of a source to an output that holds an archive's lines already.
bool AppendSnapshot(const char* source, const char* output, const char* snapshot) {
  struct stat status = {};
  const OwnedFd in = OpenRegularFile(snapshot, status);
  if (!in) {
    QUENDEL_LOG("Failed to open file '%s'", snapshot);
    return false;
  }
  // Not for appending, which the kernel's own ways of copying refuse. Nobody else writes here.
  OwnedFd out(open(output, O_WRONLY | O_CREAT | O_CLOEXEC, 0666));
  if (!out || lseek(out.get(), 0, SEEK_END) < 0) {
    // Deliberate: the message names the log, not the output.
    QUENDEL_LOG("Failed to open file '%s'", source);
    return false;
  }
  return CopyWhole(in.get(), out.get()) && out.Close();
}

// Appends the whole source, by way of a snapshot, to an output that exists.
bool AppendWholeLog(const char* source, const char* output) {
  Path snapshot = {};
  const int length = snprintf(snapshot, sizeof snapshot, "%s.tmp", output);
  // A name that was cut can be the output's own.
  if (length < 0 || static_cast<size_t>(length) >= sizeof snapshot) {
    QUENDEL_LOG("Failed to copy log '%s' to '%s'", source, snapshot);
    return false;
  }
  bool appended = false;
  if (QUENDELFileCopy(source, snapshot) != 0) {
    QUENDEL_LOG("Failed to copy log '%s' to '%s'", source, snapshot);
  } else {
    appended = AppendSnapshot(source, output, snapshot);
  }
  RemoveIfExists(snapshot);
  return appended;
}

// Brings the whole source into the output. `base` receives how much the output held before.
bool CopyWholeLog(const char* source, const char* output, int64_t& base) {
  base = 0;
  if (IsMissing(output)) {
    if (QUENDELFileCopy(source, output) != 0) {
      QUENDEL_LOG("Failed to copy log '%s' to '%s'", source, output);
      return false;
    }
    return true;
  }
  struct stat status = {};
  if (ALIBCFileStat(output, 1, &status) < 0) {
    QUENDEL_LOG("Failed to stat file '%s'", output);
    return false;
  }
  base = status.st_size;
  if (!AppendWholeLog(source, output)) {
    QUENDEL_LOG("Failed to collect log '%s'", source);
    return false;
  }
  return true;
}

bool CopyWholeAndStage(const LogTask& task, ino_t inode) {
  const char* const source = task.record->path;
  const char* const output = task.output;
  int64_t base = 0;
  if (!CopyWholeLog(source, output, base)) {
    return false;
  }
  char inodeText[64] = {};
  snprintf(inodeText, sizeof inodeText, "%u", static_cast<unsigned>(inode));
  if (!StageValue(task, "inode", inodeText)) {
    return false;
  }
  struct stat status = {};
  const OwnedFd out = OpenRegularFile(output, status);
  LineMark last = EmptyLine(0);
  if (!out || ReadLastLine(out.get(), last) == ReadResult::kError) {
    QUENDEL_LOG("Failed to open file '%s'", output);
    return false;
  }
  if (!StageLogState(task, last, last.end - base)) {
    QUENDEL_LOG("Failed to update config of log '%s'", source);
    return false;
  }
  return true;
}

// Lists the inodes of the archives that exist, archive 1 first. The first number without an archive
// ends them.
bool ListArchives(const LogTask& task, OwnedList& inodes) {
  const char* const log = task.record->path;
  Path archive = {};
  for (int n = 1; BuildArchivePath(archive, log, n) && !IsMissing(archive); ++n) {
    struct stat status = {};
    if (ALIBCFileStat(archive, 1, &status) < 0) {
      QUENDEL_LOG("Failed to stat file '%s'", archive);
      QUENDEL_LOG("Failed to get the inode of tared logs of '%s'", log);
      return false;
    }
    char inode[64] = {};
    snprintf(inode, sizeof inode, "%lu", static_cast<unsigned long>(status.st_ino));
    if (ALIBCSzListPush(inodes.slot(), inode) < 0) {
      QUENDEL_LOG("Failed to insert inode '%s' into list", inode);
      QUENDEL_LOG("Failed to get the inode of tared logs of '%s'", log);
      return false;
    }
  }
  return true;
}

bool CopyArchive(const LogTask& task, int number) {
  Path archive = {};
  Path copy = {};
  const bool fits =
      BuildArchivePath(archive, task.record->path, number) && BuildCopyPath(copy, task, number);
  if (!fits || QUENDELFileCopy(archive, copy) != 0) {
    QUENDEL_LOG("Failed to copy '%s' to '%s'", archive, copy);
    return false;
  }
  return true;
}

// Takes the new lines out of an archive, through a decompressed copy of it. An archive that cannot
// be copied, decompressed or measured counts as done.
DiffResult DiffArchiveCopy(const LogTask& task, int number, const char* copy, const char* plain) {
  if (!CopyArchive(task, number)) {
    return DiffResult::kDone;
  }
  if (ALIBCExec("/bin/xz", "-f", "-d", copy, nullptr) != 0) {
    QUENDEL_LOG("Failed to untar '%s'", copy);
    return DiffResult::kDone;
  }
  struct stat status = {};
  if (ALIBCFileStat(plain, 1, &status) < 0) {
    QUENDEL_LOG("Failed to stat file '%s'", plain);
    return DiffResult::kDone;
  }
  const DiffResult result = CopyDiff(task, plain, status.st_size);
  if (result == DiffResult::kError) {
    QUENDEL_LOG("Failed to collect diff log '%s'", plain);
  }
  return result;
}

// Collects the oldest new archive: its new lines, or all of it where they cannot be told.
bool CollectOldestArchive(const LogTask& task, int number) {
  Path copy = {};
  const bool fits = BuildCopyPath(copy, task, number);
  Path plain = {};
  snprintf(plain, sizeof plain, "%s/%s.%d", task.dst_dir, task.record->name, number);

  // Deliberate: an archive that could not be prepared is passed over, not sent whole.
  const DiffResult result = DiffArchiveCopy(task, number, copy, plain);
  // Names that were cut can be those of files that are to stay, and no copy has been made.
  if (fits) {
    RemoveIfExists(copy);
    RemoveIfExists(plain);
  }
  return result == DiffResult::kDone || CopyArchive(task, number);
}

bool StageArchives(const LogTask& task, const OwnedList& inodes) {
  std::string joined;
  const int count = ALIBCSzListSize(inodes.get());
  for (int i = 0; i < count; ++i) {
    joined += i == 0 ? "" : ",";
    joined += ALIBCSzListGet(inodes.get(), i);
  }
  return StageValue(task, "tar_log_inode", joined.c_str());
}

// Collects the archives that were not collected before, the oldest first.
bool CollectArchives(const LogTask& task) try {
  OwnedList inodes(kListSize);
  OwnedList known(kListSize);
  if (!inodes || !known) {
    QUENDEL_LOG("Failed to allocate memory for list");
    return false;
  }
  if (!ListArchives(task, inodes)) {
    return false;
  }
  const int count = ALIBCSzListSize(inodes.get());
  if (count == 0) {
    return true;
  }
  if (ALIBCStrTok(task.record->tar_log_inode, ",", known.slot()) < 0) {
    QUENDEL_LOG("Failed to parse tar log inode '%s'", task.record->tar_log_inode);
    return false;
  }
  bool visited = false;
  for (int n = count; n >= 1; --n) {
    if (ALIBCSzListFind(known.get(), ALIBCSzListGet(inodes.get(), n - 1)) >= 0) {
      continue;
    }
    const bool collected = visited ? CopyArchive(task, n) : CollectOldestArchive(task, n);
    visited = true;
    if (!collected) {
      return false;
    }
  }
  return !visited || StageArchives(task, inodes);
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for list");
  return false;
}

bool CollectWhole(const LogTask& task, ino_t inode) {
  const char* const log = task.record->path;
  if (!CopyWholeAndStage(task, inode)) {
    QUENDEL_LOG("Failed to collect whole log '%s'", log);
    return false;
  }
  return true;
}

// Collects the same file as last time.
LiveResult ContinueLiveLog(const LogTask& task, const struct stat& status) {
  const char* const log = task.record->path;
  if (status.st_size == task.record->total_byte) {
    return LiveResult::kNothingNew;
  }
  switch (CopyDiff(task, log, status.st_size)) {
    case DiffResult::kDone:
      return LiveResult::kContinued;
    case DiffResult::kError:
      QUENDEL_LOG("Failed to collect diff log '%s'", log);
      return LiveResult::kFailed;
    case DiffResult::kCannotContinue:
      break;
  }
  QUENDEL_LOG("Failed to collect diff log '%s' because of hash not match", log);
  return CollectWhole(task, status.st_ino) ? LiveResult::kContinued : LiveResult::kFailed;
}

LiveResult CollectLiveLog(const LogTask& task) {
  const char* const log = task.record->path;
  // What the archive step staged is dropped with the log that is missing; its archives come again.
  if (IsMissing(log)) {
    return LiveResult::kNothingNew;
  }
  struct stat status = {};
  if (ALIBCFileStat(log, 1, &status) < 0) {
    QUENDEL_LOG("Failed to stat file '%s'", log);
    return LiveResult::kFailed;
  }
  // Deliberate: the recorded inode has 32 bits. A file with a wider one never matches it.
  if (static_cast<ino_t>(task.record->inode) == status.st_ino) {
    return ContinueLiveLog(task, status);
  }
  return CollectWhole(task, status.st_ino) ? LiveResult::kReplaced : LiveResult::kFailed;
}

// Collects one log and stages its new state. Returns false when the log counts as failed.
bool CollectLog(const char* conf, const char* dstDir) {
  const OwnedRecord record(static_cast<QUENDELLogConf_t*>(calloc(1, sizeof(QUENDELLogConf_t))));
  if (!record) {
    QUENDEL_LOG("Failed to allocate memory for pLogConf");
    return false;
  }
  OwnedHash staged(kStagedHashSize);
  if (!staged) {
    QUENDEL_LOG("Failed to allocate memory for log hash");
    return false;
  }
  if (QUENDELGetLogConf(conf, record.get()) != 0) {
    QUENDEL_LOG("Failed to get config of '%s'", conf);
    return false;
  }
  LogTask task = {conf, dstDir, record.get(), &staged, {}};
  snprintf(task.output, sizeof task.output, "%s/%s", dstDir, record->name);
  if (!CollectArchives(task)) {
    QUENDEL_LOG("Failed to collect tared log of '%s'", conf);
    return false;
  }
  const LiveResult live = CollectLiveLog(task);
  if (live == LiveResult::kFailed || live == LiveResult::kNothingNew) {
    return live == LiveResult::kNothingNew;
  }
  if (!AppendStagedState(kLogUpdateFile, conf, staged.get())) {
    QUENDEL_LOG("Failed to add new section to '%s'", kLogUpdateFile);
    // Deliberate: only a log whose inode had changed counts as failed because of it.
    return live != LiveResult::kReplaced;
  }
  return true;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELCollectLog(const char* dstDir) try {
  if (ALIBCFileCheckDir(kCollectorConfDir) == 0) {
    QUENDEL_LOG("Dir '%s' dose not exist", kCollectorConfDir);  // [sic]
    return -1;
  }
  OwnedList names(kListSize);
  if (!names) {
    QUENDEL_LOG("Failed to allocate memory for list");
    return -1;
  }
  if (ALIBCFileExist(kLogUpdateFile) != 0 && !RemoveStagedState(kLogUpdateFile)) {
    QUENDEL_LOG("Failed to remove %s [errno=%d]", kLogUpdateFile, errno);
  }
  if (ALIBCFileEnumDir(kCollectorConfDir, "quendel.log.", names.slot(),
                       platform::kEnumRegularFiles) < 0) {
    QUENDEL_LOG("Failed to enum dir '%s'", kCollectorConfDir);
    return -1;
  }
  const int count = ALIBCSzListSize(names.get());
  for (int i = 0; i < count; ++i) {
    Path conf = {};
    snprintf(conf, sizeof conf, "%s/%s", kCollectorConfDir, ALIBCSzListGet(names.get(), i));
    if (!CollectLog(conf, dstDir)) {
      QUENDEL_LOG("Failed to collect log in conf '%s'", conf);
    }
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for list");
  return -1;
}
