// The two files in which the collectors stage their new state until the run commits it.
#include "collectors/staged_state.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/ownership.h"
#include "base/paths.h"
#include "platform/key_value.h"

namespace quendel {
namespace {

constexpr pid_t kNoRun = 0;

// Whose run this process stages for.
pid_t runParent = kNoRun;

// A child that outlives its run would stage into the files that the next run commits.
bool RunIsAlive() {
  errno = ESRCH;
  return runParent == kNoRun || getppid() == runParent;
}

bool IsSafe(const char* file) {
  return IsOurDirectory(kWorkRoot) && IsOurFileOrNothing(file);
}

}  // namespace

void StageForRunOf(pid_t parent) {
  runParent = parent;
}

bool RemoveStagedState(const char* file) {
  return IsOurDirectory(kWorkRoot) && RunIsAlive() && remove(file) == 0;
}

bool AppendStagedState(const char* file, const char* conf, ALIBSZHASH* state) {
  return IsSafe(file) && RunIsAlive() && ALIBCFileAddSection(file, conf, state, 0) >= 1;
}

bool MayBeCommitted(const char* file) {
  const bool isOurs = strcmp(file, kLogUpdateFile) == 0 || strcmp(file, kUdcUpdateFile) == 0;
  return !isOurs || IsSafe(file);
}

}  // namespace quendel
