// One collection run, from an empty directory to the delivered archive.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "base/log.h"
#include "base/paths.h"
#include "collect/collector_child.h"
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

// What each kind of child does, and what it logs when that fails.
struct Collector {
  const char* kind;
  int (*collect)(const char* directory);
  const char* failure;
};
constexpr Collector kCollectors[] = {
    {"udc", QUENDELCollectUDC, "Error occured when child collecting UDC"},  // [sic] message
    {"log", QUENDELCollectLog, "Error occured when child collecting log"},  // [sic] message
};

struct Run {
  time_t start = 0;
  char directory[64] = {};
  char perf[64] = {};
  char archive[64] = {};
  CollectorChild udc = {"udc"};
  CollectorChild log = {"log"};
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

bool MakeDir(const char* path, const char* what) {
  if (mkdir(path, kPrivateMode) != 0 && errno != EEXIST) {
    QUENDEL_LOG("Failed to create %s collect dir '%s'", what, path);
    return false;
  }
  return true;
}

bool MakeWorkRoot() {
  // Deliberate: a work root that cannot be made is reported like the user-defined collectors'
  // directory.
  return ALIBCFileCheckDir(kWorkRoot) == 1 || MakeDir(kWorkRoot, "UDC");
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
  AppendTo(run.udc.directory, run.directory, "/udc");
  AppendTo(run.log.directory, run.directory, "/log");
  AppendTo(run.perf, run.directory, "/perf");
  AppendTo(run.archive, run.directory, ".tar.xz");
}

bool MakeRunDirs(const Run& run) {
  const struct {
    const char* path;
    const char* what;
  } directories[] = {
      {run.directory, "quendel"},
      {run.udc.directory, "UDC"},
      {run.log.directory, "log"},
      {run.perf, "perf"},
  };
  for (const auto& directory : directories) {
    if (!MakeDir(directory.path, directory.what)) {
      return false;
    }
  }
  return true;
}

// What an older run reached and did not commit must not be taken for this run's, should a child die
// before it gets to removing its own.
void DropStagedState() {
  remove(kLogUpdateFile);
  remove(kUdcUpdateFile);
}

const Collector* FindCollector(const char* kind) {
  for (const Collector& collector : kCollectors) {
    if (strcmp(collector.kind, kind) == 0) {
      return &collector;
    }
  }
  return nullptr;
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

// The child's whole life. An exception here would carry the child up into its parent's callers, so
// none may pass.
[[noreturn]] void GatherAndExit(const Collector& collector, const char* directory) noexcept {
  if (signal(SIGTERM, SIG_DFL) == SIG_ERR) {
    QUENDEL_LOG("Failed to setup signal handler for %s collector: %m", collector.kind);
  }
  MaskSigterm(SIG_UNBLOCK, nullptr);
  ReadNothing();
  if (collector.collect(directory) != 0) {
    QUENDEL_LOG("%s", collector.failure);
  }
  _exit(0);  // Deliberate: a collector's failure never shows in the exit status.
}

void TouchMarker(CollectorChild& child) {
  snprintf(child.marker, sizeof child.marker, "%s/%s.p.%d", kWorkRoot, child.kind, child.id);
  if (ALIBCFileTouch(child.marker) != 0) {
    QUENDEL_LOG("Failed to touch file '%s'", child.marker);
  }
}

bool StartChildren(Run& run) {
  if (StartCollectorChild(run.udc) != 0) {
    QUENDEL_LOG("Failed to collect UDC");
    return false;
  }
  if (StartCollectorChild(run.log) != 0) {
    QUENDEL_LOG("Failed to collect logs");
    return false;
  }
  return true;
}

void WritePerformance(const Run& run, const Json::Value& perfSeries) {
  if (QUENDELParsePerfJson(run.perf, perfSeries) != 0) {
    QUENDEL_LOG("Error occured when parse perf data");  // [sic]
  }
}

// The user-defined collectors' results are written after their state was staged. A child that was
// killed in between has told nothing, and none of it may count as told.
void DropUnwrittenResults(int status) {
  if (WIFSIGNALED(status)) {
    remove(kUdcUpdateFile);
  }
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
    } else if (ended == run.udc.id) {
      run.udc.finished = true;
      DropUnwrittenResults(status);
    } else if (ended == run.log.id) {
      run.log.finished = true;
    } else {
      QUENDEL_LOG("Error happened when wait all children done");
      return false;
    }
    if (run.udc.finished && run.log.finished) {
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

// Counts what was gathered as collected. From here on the next run leaves it out.
bool CommitState() {
  if (QUENDELUpdateCollectConf(kLogUpdateFile) != 0) {
    QUENDEL_LOG("Failed to update log config");
    return false;
  }
  if (QUENDELUpdateCollectConf(kUdcUpdateFile) != 0) {
    QUENDEL_LOG("Failed to update udc config");
    return false;
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
void EndChild(const CollectorChild& child) {
  if (kill(child.id, 0) != 0) {
    return;
  }
  if (kill(child.id, SIGTERM) != 0) {
    QUENDEL_LOG("Failed to kill a child for %s", child.kind);
  }
  int status = 0;
  if (waitpid(child.id, &status, WUNTRACED) == -1) {
    QUENDEL_LOG("Failed to wait a child for %s, err=%m", child.kind);
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

void RemoveRunDir(const char* path) {
  if (ALIBCFileCheckDir(path) == 1 && ALIBCopyRemoveDir(path) != 0) {
    QUENDEL_LOG("Error happened when remove %s, errno:%d [%m]", path, errno);
  }
}

void CleanUp(const Run& run, bool removeAfter) {
  EndChild(run.udc);
  EndChild(run.log);
  RemoveFile(run.udc.marker);
  RemoveFile(run.log.marker);
  if (removeAfter) {
    RemoveRunDir(run.directory);
    RemoveFile(run.archive);
  }
}

}  // namespace

int StartCollectorChild(CollectorChild& child) {
  const Collector* collector = FindCollector(child.kind);
  if (collector == nullptr) {
    QUENDEL_LOG("Bad parameter of data: %s", child.kind);
    return -1;
  }
  // SIGTERM waits until the child has its own action for it; otherwise a run that fails right after
  // the fork could see the signal swallowed by a handler that the child inherited.
  sigset_t before;
  MaskSigterm(SIG_BLOCK, &before);
  const int id = ALIBCProcForkEx(platform::kRunFlags);
  if (id == 0) {
    GatherAndExit(*collector, child.directory);
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  if (id < 0) {
    QUENDEL_LOG("Failed to fork a child to collect %s", child.kind);
    return -1;
  }
  child.id = id;
  TouchMarker(child);
  return 0;
}

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
