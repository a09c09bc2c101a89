// A program that runs, and how it ends.
//
// A process that ignores SIGCHLD, or asked not to have zombies, never learns how its children end.
// It is not ours to change that: other threads may rely on it. So there a helper, a child that
// differs in this alone, starts the program, waits for it, and reports through a pipe: first the
// error number of the start, 0 for none, then the status.
#include "platform/standalone/started_program.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <csignal>
#include <utility>

#include "platform/standalone/error_code.h"

namespace platform {
namespace {

using quendel::OwnedFd;

constexpr char kNullDevice[] = "/dev/null";
constexpr int kFirstOtherDescriptor = 3;

// The actions and attributes of a start; both hold memory that must be given back.
class SpawnPlan {
 public:
  SpawnPlan() {
    posix_spawn_file_actions_init(&actions_);
    posix_spawnattr_init(&attributes_);
  }
  ~SpawnPlan() {
    posix_spawn_file_actions_destroy(&actions_);
    posix_spawnattr_destroy(&attributes_);
  }
  SpawnPlan(const SpawnPlan&) = delete;
  SpawnPlan& operator=(const SpawnPlan&) = delete;

  // Gives the child its three streams, of which `output` is /dev/null when it is negative, and no
  // other descriptor. Returns an error number, 0 when all is well.
  int SetStreams(int output) {
    int error = posix_spawn_file_actions_addopen(&actions_, STDIN_FILENO, kNullDevice, O_RDONLY, 0);
    if (error == 0 && output < 0) {
      error = posix_spawn_file_actions_addopen(&actions_, STDOUT_FILENO, kNullDevice, O_WRONLY, 0);
    } else if (error == 0) {
      error = posix_spawn_file_actions_adddup2(&actions_, output, STDOUT_FILENO);
    }
    if (error == 0) {
      error = posix_spawn_file_actions_addopen(&actions_, STDERR_FILENO, kNullDevice, O_WRONLY, 0);
    }
    return error != 0 ? error
                      : posix_spawn_file_actions_addclosefrom_np(&actions_, kFirstOtherDescriptor);
  }

  // Signals that this process ignores or blocks are its own affair, not its programs'.
  void ResetSignals() {
    sigset_t all;
    sigset_t none;
    sigfillset(&all);
    sigemptyset(&none);
    posix_spawnattr_setsigdefault(&attributes_, &all);
    posix_spawnattr_setsigmask(&attributes_, &none);
    posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
  }

  int Start(pid_t* child, const std::vector<char*>& argv) const {
    return posix_spawn(child, argv[0], &actions_, &attributes_, argv.data(), environ);
  }

 private:
  posix_spawn_file_actions_t actions_;
  posix_spawnattr_t attributes_;
};

bool LosesStatuses() {
  struct sigaction action;
  return sigaction(SIGCHLD, nullptr, &action) == 0 &&
         (action.sa_handler == SIG_IGN || (action.sa_flags & SA_NOCLDWAIT) != 0);
}

// Waits for a child's end. Returns its status, negative with errno set on failure.
int StatusOf(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) {
      return -1;
    }
  }
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

// Numbers go through the report's pipe whole: they are shorter than what a pipe takes at once.
bool SendNumber(int pipe, int number) {
  return write(pipe, &number, sizeof number) == static_cast<ssize_t>(sizeof number);
}

bool ReceiveNumber(int pipe, int& number) {
  ssize_t got = 0;
  do {
    got = read(pipe, &number, sizeof number);
  } while (got < 0 && errno == EINTR);
  return got == static_cast<ssize_t>(sizeof number);
}

void CloseAllBut(int fd) {
  if (fd > 0) {
    close_range(0, static_cast<unsigned>(fd) - 1, 0);
  }
  close_range(static_cast<unsigned>(fd) + 1, UINT_MAX, 0);
}

// The helper's whole life. All signals are blocked, so that one that is meant for the program, by
// way of its group, does not end the helper before it.
[[noreturn]] void HelpAndExit(const SpawnPlan& plan, const std::vector<char*>& argv, int report) {
  signal(SIGCHLD, SIG_DFL);
  pid_t child = -1;
  const int error = plan.Start(&child, argv);
  if (SendNumber(report, error) && error == 0) {
    // What the caller has open must not stay open for as long as the program runs.
    CloseAllBut(report);
    SendNumber(report, StatusOf(child));
  }
  _exit(0);
}

// Forks the helper with all signals blocked. Returns its id, negative with errno set on failure.
pid_t ForkHelper(const SpawnPlan& plan, const std::vector<char*>& argv, int report) {
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &before);
  const pid_t helper = fork();
  if (helper == 0) {
    HelpAndExit(plan, argv, report);
  }
  const int reason = errno;
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  errno = reason;
  return helper;
}

// Returns the end of the report that is read, none with errno set when the program was not started.
OwnedFd StartByHelper(const SpawnPlan& plan, const std::vector<char*>& argv) {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) {
    return OwnedFd();
  }
  OwnedFd readEnd(ends[0]);
  OwnedFd writeEnd(ends[1]);
  if (ForkHelper(plan, argv, writeEnd.get()) < 0) {
    return OwnedFd();
  }
  writeEnd.Close();  // so that a helper that is gone ends the report
  int error = 0;
  if (!ReceiveNumber(readEnd.get(), error)) {
    error = ECHILD;
  }
  errno = error;
  return error == 0 ? std::move(readEnd) : OwnedFd();
}

}  // namespace

StartedProgram StartProgram(const std::vector<char*>& argv, int output) {
  StartedProgram program;
  SpawnPlan plan;
  plan.ResetSignals();
  int error = plan.SetStreams(output);
  if (error == 0 && LosesStatuses()) {
    program.report = StartByHelper(plan, argv);
    error = program.report ? 0 : errno;
  } else if (error == 0) {
    error = plan.Start(&program.child, argv);
  }
  if (error != 0) {
    errno = error;
    Fail(kErrorNotStarted);
    return {};
  }
  return program;
}

int WaitForStatus(const StartedProgram& program) {
  int status = -1;
  if (!program.report) {
    status = StatusOf(program.child);
  } else if (!ReceiveNumber(program.report.get(), status)) {
    errno = ECHILD;
  }
  return status >= 0 ? status : Fail(kErrorStatusLost);
}

}  // namespace platform
