// What the tests of a collection run share.
#include "collect/collection.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/require.h"

namespace quendel::test {
void StopTheClock() {
  Require(setenv("TZ", "UTC", 1) == 0, "no memory");
  SetClock(kStart);
}

void InstallCollectors(const std::string& raid) {
  WriteFile("/volume1/messages", "first\nsecond\n");
  InstallLog("messages", "/volume1/messages");
  InstallUdc("raid", raid);
}

std::map<std::string, std::string> CollectorConf() {
  std::map<std::string, std::string> files;
  for (const auto& entry : std::filesystem::directory_iterator("/usr/arvo/etc/quendel")) {
    const std::string path = entry.path();
    if (entry.path().filename().string()[0] != '.') {  // the lock beside a file that was written
      files[path] = ReadFile(path);
    }
  }
  return files;
}

Json::Value PerfSeries() {
  Json::Value series;
  series["perf_0"]["success"] = true;
  Json::Value& data = series["perf_0"]["perf_data"]["data"];
  data["time"] = 1;
  for (const char* category : {"iSCSI", "System", "DiskIO", "SpaceIO", "Network", "Memory"}) {
    data[category] = category;
  }
  return series;
}

const char* CollectorOf(const std::string& kind) {
  return kind == "udc" ? "QUENDELCollectUDC" : "QUENDELCollectLog";
}

int Hang(const char* /*directory*/) {
  for (;;) {
    pause();
  }
}

int DoNothing(const char* /*directory*/) {
  return 0;
}

int EndWhenTold(const char* /*directory*/) {
  while (!Exists("/tmp/end")) {
    usleep(1000);
  }
  return 0;
}

int Die(const char* /*directory*/) {
  return raise(SIGKILL);
}

pid_t ChildOf(const std::string& kind) {
  const std::string prefix = kind + ".p.";
  for (const auto& entry : std::filesystem::directory_iterator("/tmp/quendel")) {
    const std::string name = entry.path().filename();
    if (name.compare(0, prefix.size(), prefix) == 0) {
      return std::stoi(name.substr(prefix.size()));
    }
  }
  return 0;
}

void AwaitAnyChild() {
  siginfo_t ended;
  waitid(P_ALL, 0, &ended, WEXITED | WNOWAIT);
}

void AwaitChild(const std::string& kind) {
  const pid_t child = ChildOf(kind);
  Require(child > 0, "the run has no child of the kind " + kind);
  siginfo_t ended;
  waitid(P_PID, static_cast<id_t>(child), &ended, WEXITED | WNOWAIT);
}

void MaskSigterm(int how) {
  sigset_t sigterm;
  sigemptyset(&sigterm);
  sigaddset(&sigterm, SIGTERM);
  sigprocmask(how, &sigterm, nullptr);
}

std::string SigtermState() {
  struct sigaction action = {};
  sigaction(SIGTERM, nullptr, &action);
  std::string state = "handled";
  if (action.sa_handler == SIG_DFL) {
    state = "default";
  } else if (action.sa_handler == SIG_IGN) {
    state = "ignored";
  }
  sigset_t blocked;
  sigprocmask(SIG_BLOCK, nullptr, &blocked);
  return state + (sigismember(&blocked, SIGTERM) == 1 ? " blocked" : " unblocked");
}

Ending InAGroupOfItsOwn(const std::function<int()>& work) {
  constexpr int kFailedExpectation = 99;
  int ends[2];
  Require(pipe(ends) == 0, "no pipe");
  const pid_t leader = fork();
  if (leader == 0) {
    setsid();
    MaskSigterm(SIG_BLOCK);
    const pid_t worker = fork();
    if (worker == 0) {
      MaskSigterm(SIG_UNBLOCK);
      alarm(60);  // ends a run that hangs
      const int result = work();
      _exit(testing::Test::HasFailure() ? kFailedExpectation : result & 1);
    }
    int status = 0;
    waitpid(worker, &status, 0);
    Ending ending;
    ending.result = WIFEXITED(status) ? -WEXITSTATUS(status) : 0;
    ending.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    sigset_t sigterm;
    sigemptyset(&sigterm);
    sigaddset(&sigterm, SIGTERM);
    const timespec now = {};
    ending.group_got_sigterm = sigtimedwait(&sigterm, nullptr, &now) == SIGTERM;
    _exit(write(ends[1], &ending, sizeof ending) == sizeof ending ? 0 : 1);
  }
  Ending ending;
  Require(read(ends[0], &ending, sizeof ending) == sizeof ending, "the work left no result");
  waitpid(leader, nullptr, 0);
  close(ends[0]);
  close(ends[1]);
  EXPECT_NE(ending.result, -kFailedExpectation) << "an expectation of the work failed, see above";
  return ending;
}

}  // namespace quendel::test
