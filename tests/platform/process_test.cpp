// Running programs.
#include "platform/process.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include "platform/error.h"
#include "support/appliance.h"
#include "support/calls.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

constexpr char kProgram[] = "/tmp/bin/program";
constexpr char kSaid[] = "/tmp/said";

// Makes a program of shell lines.
void MakeProgram(const std::string& lines, const char* path = kProgram) {
  WriteFile(path, "#!/bin/sh\n" + lines + "\n");
  chmod(path, 0755);
}

int RunProgram() {
  return ALIBCExec(kProgram, nullptr, nullptr, nullptr, nullptr);
}

// What the program says, and its status.
std::string Say(int* status = nullptr) {
  FILE* const stream = ALIBCPopen(kProgram, "r", nullptr);
  if (stream == nullptr) {
    return "(failed)";
  }
  std::string text;
  for (int c = fgetc(stream); c != EOF; c = fgetc(stream)) {
    text += static_cast<char>(c);
  }
  const int result = ALIBCPclose(stream);
  if (status != nullptr) {
    *status = result;
  }
  return text;
}

int FreeDescriptor() {
  const int fd = open("/dev/null", O_RDONLY);
  close(fd);
  return fd;
}

bool HasChildren() {
  return waitpid(-1, nullptr, WNOHANG) != -1 || errno != ECHILD;
}

constexpr char kSayArguments[] = "for a; do printf '<%s>' \"$a\"; done >/tmp/said";

}  // namespace

TEST(ExecTest, PassesArgumentsAsTheyStand) {
  MakeProgram(kSayArguments);
  EXPECT_EQ(ALIBCExec(kProgram, "a b", "$HOME `id` *", "", "'\"\\\n;"), 0);
  EXPECT_EQ(ReadFile(kSaid), "<a b><$HOME `id` *><><'\"\\\n;>");
}

TEST(ExecTest, EndsTheListAtTheFirstNull) {
  MakeProgram(kSayArguments);
  EXPECT_EQ(ALIBCExec(kProgram, "a", nullptr, "c", "d"), 0);
  EXPECT_EQ(ReadFile(kSaid), "<a>");
  EXPECT_EQ(ALIBCExec(kProgram, nullptr, "b", "c", "d"), 0);
  EXPECT_EQ(ReadFile(kSaid), "");
}

TEST(ExecTest, NamesTheProgramByItsPath) {
  MakeProgram("echo \"$0\" >/tmp/said");
  EXPECT_EQ(RunProgram(), 0);
  EXPECT_EQ(ReadFile(kSaid), "/tmp/bin/program\n");
}

TEST(ExecTest, ReturnsTheExitStatus) {
  for (const int status : {0, 1, 42, 127, 255}) {
    MakeProgram("exit " + std::to_string(status));
    EXPECT_EQ(RunProgram(), status);
  }
}

TEST(ExecTest, ReturnsTheSignalThatEndedIt) {
  MakeProgram("kill -9 $$");
  EXPECT_EQ(RunProgram(), 128 + SIGKILL);
  MakeProgram("kill -TERM $$");
  EXPECT_EQ(RunProgram(), 128 + SIGTERM);
}

TEST(ExecTest, FailsWhenTheProgramIsNotThere) {
  EXPECT_EQ(RunProgram(), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0800);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(HasChildren());
}

TEST(ExecTest, FailsWhenTheProgramCannotBeExecuted) {
  WriteFile(kProgram, "#!/bin/sh\n");
  chmod(kProgram, 0644);
  EXPECT_EQ(RunProgram(), -1);
  EXPECT_EQ(errno, EACCES);
  EXPECT_EQ(ALIBCExec("/tmp", nullptr, nullptr, nullptr, nullptr), -1);
  EXPECT_EQ(errno, EACCES);
}

TEST(ExecTest, NeverAsksAShell) {
  // A shell would take a script without a first line that names one.
  WriteFile(kProgram, "exit 0\n");
  chmod(kProgram, 0755);
  EXPECT_EQ(RunProgram(), -1);
  EXPECT_EQ(errno, ENOEXEC);
  // Nor is the program looked for.
  EXPECT_EQ(ALIBCExec("true", nullptr, nullptr, nullptr, nullptr), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST(ExecTest, RefusesNoProgram) {
  EXPECT_EQ(ALIBCExec(nullptr, "a", nullptr, nullptr, nullptr), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
}

TEST(ExecTest, GivesNullDevicesForTheStandardStreams) {
  MakeProgram("said=$(readlink /proc/$$/fd/0 /proc/$$/fd/1 /proc/$$/fd/2); echo $said >/tmp/said");
  EXPECT_EQ(RunProgram(), 0);
  EXPECT_EQ(ReadFile(kSaid), "/dev/null /dev/null /dev/null\n");
}

TEST(ExecTest, PassesNoOtherDescriptor) {
  // The shell itself opens 10, for the script that it reads, and 3, for the folder that it lists.
  MakeProgram("cd /proc/$$/fd; set -- *; echo $* >/tmp/said");
  const int low = open("/etc/passwd", O_RDONLY);
  ASSERT_EQ(dup2(low, 100), 100);
  ASSERT_EQ(dup2(low, 700), 700);
  EXPECT_EQ(RunProgram(), 0);
  EXPECT_EQ(ReadFile(kSaid), "0 1 10 2 3\n");
}

TEST(ExecTest, PassesTheEnvironment) {
  MakeProgram("echo \"$QUENDEL_TEST\" >/tmp/said");
  setenv("QUENDEL_TEST", "a b", 1);
  EXPECT_EQ(RunProgram(), 0);
  EXPECT_EQ(ReadFile(kSaid), "a b\n");
}

TEST(ExecTest, GivesDefaultActionsAndAnEmptyMaskOfSignals) {
  sigset_t all;
  sigfillset(&all);
  sigprocmask(SIG_BLOCK, &all, nullptr);
  for (int number = 1; number <= SIGRTMAX; ++number) {
    signal(number, SIG_IGN);
  }
  signal(SIGCHLD, SIG_DFL);
  EXPECT_EQ(ALIBCExec("/bin/cp", "/proc/self/status", kSaid, nullptr, nullptr), 0);
  EXPECT_THAT(ReadFile(kSaid), HasSubstr("SigBlk:\t0000000000000000\n"));
  // The two that the C library keeps for itself stay ignored in every program that it starts.
  EXPECT_THAT(ReadFile(kSaid), HasSubstr("SigIgn:\t0000000180000000\n"));
}

TEST(ExecTest, IsNotDisturbedBySignals) {
  MakeProgram("sleep 0.3; exit 7");
  struct sigaction action = {};
  action.sa_handler = [](int) {};  // without SA_RESTART: waiting calls end with EINTR
  sigaction(SIGUSR1, &action, nullptr);
  const pthread_t self = pthread_self();
  std::thread disturber([self] {
    for (int i = 0; i < 20; ++i) {
      std::this_thread::sleep_for(std::chrono::milliseconds(5));
      pthread_kill(self, SIGUSR1);
    }
  });
  EXPECT_EQ(RunProgram(), 7);
  disturber.join();
}

TEST(ExecTest, LeavesOtherChildrenToTheirParent) {
  MakeProgram("exit 3");
  const pid_t other = fork();
  if (other == 0) {
    _exit(5);
  }
  EXPECT_EQ(RunProgram(), 3);
  int status = 0;
  EXPECT_EQ(waitpid(other, &status, 0), other);
  EXPECT_EQ(WEXITSTATUS(status), 5);
  EXPECT_FALSE(HasChildren());
}

TEST(ExecTest, WaitsForTheProgramOnly) {
  MakeProgram("sleep 60 & exit 4");
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(RunProgram(), 4);
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(30));
}

TEST(ExecTest, SaysThatAStatusIsLostWhenSomebodyElseReapsTheChild) {
  MakeProgram("exit 0");
  On("waitpid").InPlatform().Nth(1).Return(-1, ECHILD);
  EXPECT_EQ(RunProgram(), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0801);
  EXPECT_EQ(errno, ECHILD);
}

// ---- A caller that does not want to know of its children's ends ----

// The two ways to say so. Each leaves no zombies.
void IgnoreChildren() {
  signal(SIGCHLD, SIG_IGN);
}

void WantNoZombies() {
  struct sigaction action = {};
  action.sa_handler = SIG_DFL;
  action.sa_flags = SA_NOCLDWAIT;
  sigaction(SIGCHLD, &action, nullptr);
}

// Tells whether the process still says it in the same way, and has no child left.
void ExpectNothingChanged(void (*how)()) {
  struct sigaction action = {};
  sigaction(SIGCHLD, nullptr, &action);
  EXPECT_EQ(action.sa_handler == SIG_IGN, how == IgnoreChildren);
  EXPECT_EQ((action.sa_flags & SA_NOCLDWAIT) != 0, how == WantNoZombies);
  EXPECT_EQ(waitpid(-1, nullptr, 0), -1);  // waits for the last of them
  EXPECT_EQ(errno, ECHILD);
}

class IgnoredChildrenTest : public testing::TestWithParam<void (*)()> {
 protected:
  void SetUp() override { GetParam()(); }
  void TearDown() override { ExpectNothingChanged(GetParam()); }
};

INSTANTIATE_TEST_SUITE_P(Both, IgnoredChildrenTest, testing::Values(IgnoreChildren, WantNoZombies));

TEST_P(IgnoredChildrenTest, LoseNoStatus) {
  const int before = FreeDescriptor();
  for (const auto& [lines, status] :
       {std::pair("exit 0", 0), std::pair("exit 7", 7), std::pair("kill -9 $$", 137)}) {
    MakeProgram(lines);
    EXPECT_EQ(RunProgram(), status);
    EXPECT_EQ(ALIBCExecl(kProgram, 187, nullptr), status);
    int streamStatus = -1;
    EXPECT_EQ(Say(&streamStatus), "");
    EXPECT_EQ(streamStatus, status);
  }
  EXPECT_EQ(FreeDescriptor(), before);
}

TEST_P(IgnoredChildrenTest, AreReadToTheirEnd) {
  MakeProgram("echo all of it; exec >&-; exit 3");
  int status = -1;
  EXPECT_EQ(Say(&status), "all of it\n");
  EXPECT_EQ(status, 3);
}

TEST_P(IgnoredChildrenTest, ThatCannotBeStartedSayWhy) {
  EXPECT_EQ(ALIBCExec("/tmp/nowhere", nullptr, nullptr, nullptr, nullptr), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(ALIBCErrGet(), 0x0800);
  EXPECT_EQ(ALIBCPopen("/tmp/nowhere", "r", nullptr), nullptr);
  EXPECT_EQ(errno, ENOENT);
}

TEST_P(IgnoredChildrenTest, GetWhatOtherProgramsGet) {
  signal(SIGUSR1, SIG_IGN);
  EXPECT_EQ(ALIBCExec("/bin/cp", "/proc/self/status", kSaid, nullptr, nullptr), 0);
  EXPECT_THAT(ReadFile(kSaid), HasSubstr("SigBlk:\t0000000000000000\n"));
  EXPECT_THAT(ReadFile(kSaid), HasSubstr("SigIgn:\t0000000180000000\n"));
  const int open3 = open("/dev/null", O_RDONLY);
  MakeProgram("ls /proc/$$/fd >" + std::string(kSaid) + ".fd");
  EXPECT_EQ(RunProgram(), 0);
  EXPECT_THAT(ReadFile(std::string(kSaid) + ".fd"), testing::Not(HasSubstr("3\n")));
  close(open3);
}

// The helper is in the caller's group, which a collection run signals as a whole.
TEST_P(IgnoredChildrenTest, TellThatASignalToTheGroupEndedThem) {
  setpgid(0, 0);
  MakeProgram("kill -TERM 0; sleep 5");
  signal(SIGTERM, SIG_IGN);
  EXPECT_EQ(RunProgram(), 128 + SIGTERM);
}

TEST_P(IgnoredChildrenTest, LoseTheirStatusWithTheirHelper) {
  MakeProgram("sleep 0.5; kill -9 $PPID; sleep 0.1");  // once it has said that this was started
  EXPECT_EQ(RunProgram(), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0801);
  EXPECT_EQ(errno, ECHILD);
}

TEST(ExeclTest, PassesAnyNumberOfArguments) {
  MakeProgram(kSayArguments);
  EXPECT_EQ(ALIBCExecl(kProgram, 187, "1", "2", "3", "4", "5", "6", "7", "8", nullptr), 0);
  EXPECT_EQ(ReadFile(kSaid), "<1><2><3><4><5><6><7><8>");
  EXPECT_EQ(ALIBCExecl(kProgram, 187, nullptr), 0);
  EXPECT_EQ(ReadFile(kSaid), "");
}

TEST(ExeclTest, ReturnsTheStatus) {
  MakeProgram("exit 9");
  EXPECT_EQ(ALIBCExecl(kProgram, 187, nullptr), 9);
  MakeProgram("kill -9 $$");
  EXPECT_EQ(ALIBCExecl(kProgram, 187, nullptr), 137);
  EXPECT_EQ(ALIBCExecl("/tmp/nowhere", 187, nullptr), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(ALIBCExecl(nullptr, 187, nullptr), -1);
}

TEST(PopenTest, GivesTheProgramsOutput) {
  MakeProgram("printf 'a\\0b\\nc'; echo no >&2; exit 6");
  int status = 0;
  EXPECT_EQ(Say(&status), std::string("a\0b\nc", 5));
  EXPECT_EQ(status, 6);
}

TEST(PopenTest, PassesArgumentsAsTheyStand) {
  MakeProgram("for a; do printf '<%s>' \"$a\"; done");
  FILE* const stream = ALIBCPopen(kProgram, "r", "-a", "get $x", "", nullptr);
  ASSERT_NE(stream, nullptr);
  char buf[64] = {};
  EXPECT_EQ(fread(buf, 1, sizeof(buf), stream), 14U);
  EXPECT_STREQ(buf, "<-a><get $x><>");
  EXPECT_EQ(ALIBCPclose(stream), 0);
}

TEST(PopenTest, GivesNullDevicesForTheOtherStreams) {
  MakeProgram("readlink /proc/$$/fd/0 /proc/$$/fd/2; cd /proc/$$/fd; set -- *; echo $*");
  ASSERT_EQ(dup2(0, 100), 100);
  FILE* const other = ALIBCPopen("/bin/cat", "r", "/dev/null", nullptr);
  EXPECT_EQ(Say(), "/dev/null\n/dev/null\n0 1 10 2 3\n");
  EXPECT_EQ(ALIBCPclose(other), 0);
}

TEST(PopenTest, GivesALotOfOutput) {
  MakeProgram("head -c 3000000 /dev/zero");
  EXPECT_EQ(Say().size(), 3000000U);
}

TEST(PopenTest, ReturnsTheSignalThatEndedTheProgram) {
  MakeProgram("echo x; kill -KILL $$");
  int status = 0;
  EXPECT_EQ(Say(&status), "x\n");
  EXPECT_EQ(status, 137);
}

TEST(PopenTest, EndsAProgramThatStillWritesWhenClosed) {
  FILE* const stream = ALIBCPopen("/usr/bin/yes", "r", nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(fgetc(stream), 'y');
  EXPECT_EQ(ALIBCPclose(stream), 128 + SIGPIPE);
  EXPECT_FALSE(HasChildren());
}

TEST(PopenTest, WaitsForAProgramThatClosedItsOutputEarly) {
  MakeProgram("echo x; exec >&-; sleep 0.2; exit 8");
  int status = 0;
  EXPECT_EQ(Say(&status), "x\n");
  EXPECT_EQ(status, 8);
}

TEST(PopenTest, DoesNotWaitForAGrandchildThatHoldsTheOutput) {
  MakeProgram("echo x; sleep 60 & exit 2");
  FILE* const stream = ALIBCPopen(kProgram, "r", nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(fgetc(stream), 'x');
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_EQ(ALIBCPclose(stream), 2);
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(30));
}

TEST(PopenTest, WaitsForAProgramThatIgnoresSigterm) {
  MakeProgram("trap '' TERM; kill -TERM $$; echo survived; exit 1");
  int status = 0;
  EXPECT_EQ(Say(&status), "survived\n");
  EXPECT_EQ(status, 1);
}

TEST(PopenTest, KeepsSeveralStreamsApart) {
  std::vector<FILE*> streams;
  for (int i = 0; i < 10; ++i) {
    MakeProgram("echo " + std::to_string(i) + "; exit " + std::to_string(i));
    streams.push_back(ALIBCPopen(kProgram, "r", nullptr));
    ASSERT_NE(streams.back(), nullptr);
    EXPECT_EQ(fgetc(streams.back()), '0' + i);
  }
  for (int i = 9; i >= 0; --i) {
    EXPECT_EQ(ALIBCPclose(streams[static_cast<size_t>(i)]), i);
  }
}

TEST(PopenTest, ServesManyThreads) {
  MakeProgram("echo text; exit 3");
  std::vector<std::thread> threads;
  for (int i = 0; i < 8; ++i) {
    threads.emplace_back([] {
      for (int round = 0; round < 10; ++round) {
        int status = 0;
        EXPECT_EQ(Say(&status), "text\n");
        EXPECT_EQ(status, 3);
      }
    });
  }
  for (std::thread& thread : threads) {
    thread.join();
  }
}

TEST(PopenTest, WorksWithAnyOfTheStandardStreamsClosed) {
  MakeProgram("echo text; echo more; cd /proc/$$/fd; set -- *; echo $*");
  for (int closed = 0; closed < 8; ++closed) {
    const pid_t child = fork();
    if (child == 0) {
      for (int fd = 0; fd < 3; ++fd) {
        if ((closed >> fd & 1) != 0) {
          close(fd);
        }
      }
      const bool isSaid = Say() == "text\nmore\n0 1 10 2 3\n";
      _exit(isSaid && RunProgram() == 0 ? 0 : 1);
    }
    int status = -1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0) << closed;
  }
}

TEST(PopenTest, FailsWhenTheProgramCannotBeStarted) {
  const int before = FreeDescriptor();
  EXPECT_EQ(ALIBCPopen("/tmp/nowhere", "r", nullptr), nullptr);
  EXPECT_EQ(ALIBCErrGet(), 0x0800);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(ALIBCPopen("/tmp", "r", nullptr), nullptr);
  EXPECT_EQ(errno, EACCES);
  EXPECT_FALSE(HasChildren());
  EXPECT_EQ(FreeDescriptor(), before);
}

TEST(PopenTest, FailsWithoutFreeDescriptors) {
  MakeProgram("echo x");
  std::vector<int> taken;
  for (int fd = dup(0); fd >= 0; fd = dup(0)) {
    taken.push_back(fd);
  }
  errno = 0;
  FILE* const stream = ALIBCPopen(kProgram, "r", nullptr);
  const int reason = errno;
  for (const int fd : taken) {
    close(fd);
  }
  EXPECT_EQ(stream, nullptr);
  EXPECT_EQ(reason, EMFILE);
  EXPECT_EQ(Say(), "x\n");
}

TEST(PopenTest, RefusesOtherArguments) {
  MakeProgram("echo x");
  EXPECT_EQ(ALIBCPopen(nullptr, "r", nullptr), nullptr);
  EXPECT_EQ(ALIBCPopen(kProgram, nullptr, nullptr), nullptr);
  EXPECT_EQ(ALIBCPopen(kProgram, "w", nullptr), nullptr);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
}

TEST(PcloseTest, LeavesForeignStreamsAlone) {
  WriteFile("/tmp/file", "text");
  FILE* const stream = fopen("/tmp/file", "r");
  EXPECT_EQ(ALIBCPclose(stream), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
  EXPECT_EQ(fgetc(stream), 't');
  fclose(stream);
  EXPECT_EQ(ALIBCPclose(nullptr), -1);
}

TEST(PcloseTest, LeavesNoDescriptorOpen) {
  MakeProgram("echo x");
  const int before = FreeDescriptor();
  EXPECT_EQ(Say(), "x\n");
  EXPECT_EQ(FreeDescriptor(), before);
}

TEST(ProcForkExTest, ForksLikeFork) {
  const pid_t parent = getpid();
  const int child = ALIBCProcForkEx(187);
  if (child == 0) {
    _exit(getppid() == parent ? 12 : 13);
  }
  ASSERT_GT(child, 0);
  int status = 0;
  EXPECT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(WEXITSTATUS(status), 12);
}

TEST(ProcForkExTest, FailsLikeFork) {
  On("fork").InPlatform().Nth(1).Return(-1, EAGAIN);
  EXPECT_LT(ALIBCProcForkEx(187), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0800);
  EXPECT_EQ(errno, EAGAIN);
}
