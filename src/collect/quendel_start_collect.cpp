// One collection run, from an empty directory to the delivered archive.
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <iterator>

#include "base/log.h"
#include "base/ownership.h"
#include "base/paths.h"
#include "collectors/staged_state.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/process.h"
#include "quendel/collect.h"
#include "quendel/collectors.h"
#include "quendel/conf.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_start_collect";

constexpr int kDefaultWaitLimitSeconds = 600;
constexpr mode_t kPrivateMode = 0700;

// A kind of child: what it gathers, where, and what is logged of it. The run starts one of each, in
// this order.
struct Kind {
  const char* name;  // in marker files and messages
  int (*collect)(const char* directory);
  const char* directory;    // below that of the run
  const char* title;        // of the directory, in messages
  const char* staged_file;  // where its new state waits for the commit
  bool stages_first;        // before its results are written
  const char* failed;
  const char* not_started;
  const char* not_committed;
};
constexpr Kind kKinds[] = {
    {"udc", QUENDELCollectUDC, "/udc", "UDC", kUdcUpdateFile, true,
     "Error occured when child collecting UDC",  // [sic] message
     "Failed to collect UDC",                    // message
     "Failed to update udc config"},             // message
    {"log", QUENDELCollectLog, "/log", "log", kLogUpdateFile, false,
     "Error occured when child collecting log",  // [sic] message
     "Failed to collect logs",                   // message
     "Failed to update log config"},             // message
};

// A child, from the moment when its directory has a name.
struct Child {
  const Kind* kind = nullptr;
  char directory[64] = {};
  char marker[64] = {};  // an empty file that exists while it is at work
  int id = 0;            // until it is started
  bool finished = false;
};

struct Run {
  Run() {
    for (size_t i = 0; i < std::size(kKinds); ++i) {
      children[i].kind = &kKinds[i];
    }
  }

  time_t start = 0;
  char directory[64] = {};
  char perf[64] = {};
  char archive[64] = {};
  Child children[std::size(kKinds)];
};

int ReadWaitLimit() {
  char text[8] = {};
  if (ALIBCFileGetKeyValue(kDefaultsFile, "quendel_wait_collect_timeout", text, sizeof text, 0) <
      1) {
    return kDefaultWaitLimitSeconds;
  }
  const long seconds = strtol(text, nullptr, 10);
  return seconds < 1 ? kDefaultWaitLimitSeconds : static_cast<int>(seconds);
}

// Writes directory + suffix. A path that does not fit is cut, like every path of a run.
void AppendTo(char (&path)[64], const char* directory, const char* suffix) {
  if (snprintf(path, sizeof path, "%s%s", directory, suffix) < 0) {
    path[0] = '\0';
  }
}

bool MakeIfMissing(const char* path) {
  return mkdir(path, kPrivateMode) == 0 || errno == EEXIST;
}

void LogFailedDir(const char* path, const char* what) {
  QUENDEL_LOG("Failed to create %s collect dir '%s'", what, path);
}

// Makes a directory, or takes what is there when it is ours.
bool MakeDir(const char* path, const char* what) {
  if (!MakeIfMissing(path) || !IsOurs(path)) {
    LogFailedDir(path, what);
    return false;
  }
  return true;
}

bool MakeWorkRoot() {
  const bool isThere = ALIBCFileCheckDir(kWorkRoot) == 1 || MakeIfMissing(kWorkRoot);
  if (!isThere || !IsOurDirectory(kWorkRoot)) {
    LogFailedDir(kWorkRoot, "UDC");  // Deliberate: like the user-defined collectors' directory.
    return false;
  }
  return true;
}

bool CanReachServer() {
  if (QUENDELIsServerReachable() == 0) {
    QUENDEL_LOG("Failed to access server");
    return false;
  }
  return true;
}

bool TakeStartTime(Run& run) {
  run.start = time(nullptr);
  if (run.start == -1) {
    QUENDEL_LOG("Failed to get current time");
    return false;
  }
  return true;
}

void NamePaths(Run& run) {
  // Where the platform could not tell whether the name is free, making the directory decides.
  QUENDELGetDstDir(run.directory, sizeof run.directory, run.start);
  for (Child& child : run.children) {
    AppendTo(child.directory, run.directory, child.kind->directory);
  }
  AppendTo(run.perf, run.directory, "/perf");
  AppendTo(run.archive, run.directory, ".tar.xz");
}

bool MakeRunDirs(const Run& run) {
  if (!MakeDir(run.directory, "quendel")) {
    return false;
  }
  for (const Child& child : run.children) {
    if (!MakeDir(child.directory, child.kind->title)) {
      return false;
    }
  }
  return MakeDir(run.perf, "perf");
}

// What an older run reached and did not commit must not be taken for this run's, should a child die
// before it gets to removing its own.
void DropStagedState() {
  for (const Kind& kind : kKinds) {
    remove(kind.staged_file);
  }
}

// Changes whether the calling thread blocks SIGTERM, and notes how it was when `before` is given.
void MaskSigterm(int how, sigset_t* before) {
  sigset_t sigterm;
  sigemptyset(&sigterm);
  sigaddset(&sigterm, SIGTERM);
  pthread_sigmask(how, &sigterm, before);
}

// A child that read the caller's standard input would take it away from the caller.
void ReadNothing() {
  const int null = open("/dev/null", O_RDONLY | O_CLOEXEC);
  if (null > 0) {
    dup2(null, STDIN_FILENO);
    close(null);
  }
}

// A child must not outlive its run: it would go on staging, into the files that the next run
// commits. The run can have ended before this child asked for the signal.
void EndWithTheRun(pid_t run) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() != run) {
    _exit(0);
  }
  StageForRunOf(run);
}

// The child's whole life. No exception may leave it: the caller's code would go on in two
// processes.
[[noreturn]] void GatherAndExit(const Child& child, pid_t run) noexcept {
  EndWithTheRun(run);
  if (signal(SIGTERM, SIG_DFL) == SIG_ERR) {
    QUENDEL_LOG("Failed to setup signal handler for %s collector: %m", child.kind->name);
  }
  MaskSigterm(SIG_UNBLOCK, nullptr);
  ReadNothing();
  if (child.kind->collect(child.directory) != 0) {
    QUENDEL_LOG("%s", child.kind->failed);
  }
  _exit(0);  // Deliberate: a collector's failure never shows in the exit status.
}

void TouchMarker(Child& child) {
  snprintf(child.marker, sizeof child.marker, "%s/%s.p.%d", kWorkRoot, child.kind->name, child.id);
  if (!IsOurFileOrNothing(child.marker) || ALIBCFileTouch(child.marker) != 0) {
    QUENDEL_LOG("Failed to touch file '%s'", child.marker);
  }
}

// Only these two are known to whoever reads the markers.
bool IsKnown(const Kind& kind) {
  return strcmp(kind.name, "log") == 0 || strcmp(kind.name, "udc") == 0;
}

bool StartChild(Child& child) {
  if (!IsKnown(*child.kind)) {
    QUENDEL_LOG("Bad parameter of data: %s", child.kind->name);
    return false;
  }
  // SIGTERM waits until the child has its own action for it; otherwise a run that fails right after
  // the fork could see the signal swallowed by a handler that the child inherited.
  sigset_t before;
  MaskSigterm(SIG_BLOCK, &before);
  const pid_t run = getpid();
  const int id = ALIBCProcForkEx(platform::kRunFlags);
  if (id == 0) {
    GatherAndExit(child, run);
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  if (id < 0) {
    QUENDEL_LOG("Failed to fork a child to collect %s", child.kind->name);
    return false;
  }
  child.id = id;
  TouchMarker(child);
  return true;
}

bool StartChildren(Run& run) {
  for (Child& child : run.children) {
    if (!StartChild(child)) {
      QUENDEL_LOG("%s", child.kind->not_started);
      return false;
    }
  }
  return true;
}

void WritePerformance(const Run& run, const Json::Value& perfSeries) {
  if (QUENDELParsePerfJson(run.perf, perfSeries) != 0) {
    QUENDEL_LOG("Error occured when parse perf data");  // [sic]
  }
}

// A child that was killed may have staged its new state without having written the results. They
// are gathered again then.
void DropUnwrittenResults(const Child& child, int status) {
  if (child.kind->stages_first && WIFSIGNALED(status)) {
    remove(child.kind->staged_file);
  }
}

// Returns null for a process that is no child of the run.
Child* FindChild(Run& run, pid_t id) {
  for (Child& child : run.children) {
    if (child.id == id) {
      return &child;
    }
  }
  return nullptr;
}

bool AllFinished(const Run& run) {
  for (const Child& child : run.children) {
    if (!child.finished) {
      return false;
    }
  }
  return true;
}

// The limit counts the seconds slept.
//
// Deliberate: children that end during the last of them are too late. And any child of the process
// is reaped here; one that is not the run's own ends the run.
bool WaitForChildren(Run& run, int limitSeconds) {
  int secondsWaited = 0;
  while (secondsWaited < limitSeconds) {
    int status = 0;
    const pid_t ended = waitpid(-1, &status, WNOHANG);
    if (ended == 0) {
      ++secondsWaited;
      sleep(1);
      continue;
    }
    Child* const child = FindChild(run, ended);
    if (child == nullptr) {
      QUENDEL_LOG("Error happened when wait all children done");
      return false;
    }
    child->finished = true;
    DropUnwrittenResults(*child, status);
    if (AllFinished(run)) {
      return true;
    }
  }
  QUENDEL_LOG("Timeout when wait child done");
  return false;
}

bool Deliver(const Run& run) {
  if (QUENDELSendCollectData(run.archive, run.start) != 0) {
    QUENDEL_LOG("Failed to send '%s'", run.archive);
    return false;
  }
  return true;
}

// Counts what was gathered as collected, the children's state in the reverse order of their start.
// From here on the next run leaves it out.
bool CommitState() {
  for (size_t i = std::size(kKinds); i-- > 0;) {
    if (QUENDELUpdateCollectConf(kKinds[i].staged_file) != 0) {
      QUENDEL_LOG("%s", kKinds[i].not_committed);
      return false;
    }
  }
  return true;
}

bool Collect(Run& run, int limitSeconds, bool send, const Json::Value& perfSeries) {
  if (!MakeWorkRoot()) {
    return false;
  }
  if (send && !CanReachServer()) {
    return false;
  }
  if (!TakeStartTime(run)) {
    return false;
  }
  NamePaths(run);
  if (!MakeRunDirs(run)) {
    return false;
  }
  DropStagedState();
  if (!StartChildren(run)) {
    return false;
  }
  WritePerformance(run, perfSeries);
  if (!WaitForChildren(run, limitSeconds)) {
    return false;
  }
  if (QUENDELTarCollectData(run.directory, run.archive) != 0) {
    return false;
  }
  if (send && !Deliver(run)) {
    return false;
  }
  return CommitState();
}

// Ends a child that is still there.
//
// Deliberate: the id is used as it is. That of a child that was never started is 0, which means the
// process group of the caller: everything in it, this process included, gets SIGTERM.
void EndChild(const Child& child) {
  if (kill(child.id, 0) != 0) {
    return;
  }
  if (kill(child.id, SIGTERM) != 0) {
    QUENDEL_LOG("Failed to kill a child for %s", child.kind->name);
  }
  int status = 0;
  if (waitpid(child.id, &status, WUNTRACED) == -1) {
    QUENDEL_LOG("Failed to wait a child for %s, err=%m", child.kind->name);
    return;
  }
  if (!WIFEXITED(status) && !WIFSIGNALED(status)) {
    QUENDEL_LOG("%d status %d", child.id, status);
  }
}

void RemoveFile(const char* path) {
  if (ALIBCFileExist(path) != 0 && remove(path) != 0) {
    QUENDEL_LOG("Failed to remove %s [errno=%d]", path, errno);
  }
}

// A directory that was refused stays with its owner.
void RemoveRunDir(const char* path) {
  if (ALIBCFileCheckDir(path) == 1 && IsOurs(path) && ALIBCopyRemoveDir(path) != 0) {
    QUENDEL_LOG("Error happened when remove %s, errno:%d [%m]", path, errno);
  }
}

void CleanUp(const Run& run, bool removeAfter) {
  for (const Child& child : run.children) {
    EndChild(child);
  }
  for (const Child& child : run.children) {
    RemoveFile(child.marker);
  }
  if (removeAfter) {
    RemoveRunDir(run.directory);
    RemoveFile(run.archive);
  }
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetWaitPIDTimeout() {
  static const int limitSeconds = ReadWaitLimit();
  return limitSeconds;
}

int QUENDELStartCollect(int removeAfter, int sendToServer, const Json::Value& perfSeries) {
  const int limitSeconds = QUENDELGetWaitPIDTimeout();
  Run run;
  const bool collected = Collect(run, limitSeconds, sendToServer != 0, perfSeries);
  CleanUp(run, removeAfter != 0);
  return collected ? 0 : -1;
}
