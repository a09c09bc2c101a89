// A process of its own for a collection run.
#include "worker.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <ctime>
#include <exception>
#include <system_error>

namespace quendelctl {
namespace {

constexpr timespec kPause = {0, 20'000'000};
constexpr int kPausesBeforeKill = 100;

[[noreturn]] void Fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

// The signals that this program takes from a queue while a worker is there, and the mask before.
class Signals {
 public:
  Signals() {
    sigemptyset(&awaited_);
    sigaddset(&awaited_, SIGCHLD);
    for (const int number : {SIGHUP, SIGINT, SIGQUIT, SIGTERM}) {
      // One that is ignored, as nohup wants it, would not be if it were waited for.
      struct sigaction action = {};
      if (sigaction(number, nullptr, &action) == 0 && action.sa_handler != SIG_IGN) {
        sigaddset(&awaited_, number);
      }
    }
    signal(SIGCHLD, SIG_DFL);  // ignored, it would take the worker's end away
    sigprocmask(SIG_BLOCK, &awaited_, &before_);
  }
  ~Signals() {
    const timespec now = {};
    while (sigtimedwait(&awaited_, nullptr, &now) > 0) {
    }
    sigprocmask(SIG_SETMASK, &before_, nullptr);
  }
  Signals(const Signals&) = delete;
  Signals& operator=(const Signals&) = delete;

  // Returns a signal that asks this program to end, or 0 after a pause or an end of a child.
  int Await() const {
    const int number = sigtimedwait(&awaited_, nullptr, &kPause);
    return number > 0 && number != SIGCHLD ? number : 0;
  }

  // A run has to die of SIGTERM: one that lives on would wait for children that it never had.
  void RestoreForWorker() const {
    sigset_t mask = before_;
    sigdelset(&mask, SIGTERM);
    sigdelset(&mask, SIGCHLD);
    signal(SIGTERM, SIG_DFL);
    sigprocmask(SIG_SETMASK, &mask, nullptr);
  }

 private:
  sigset_t awaited_;
  sigset_t before_;
};

// What a collector leaves behind may hold the worker's streams for ever, so these are not ours. The
// standard error output is: log lines go there.
void CloseStandardStreams() {
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (null >= 0) {
    dup2(null, STDIN_FILENO);
    dup2(null, STDOUT_FILENO);
    close(null);
  }
}

// Tells the parent that the group is there, and at the end the result.
[[noreturn]] void Work(const std::function<int()>& work, const Signals& signals,
                       int report) noexcept {
  setsid();
  signals.RestoreForWorker();
  CloseStandardStreams();
  int result = 0;
  bool told = write(report, &result, sizeof result) == sizeof result;
  result = work();
  told = told && write(report, &result, sizeof result) == sizeof result;
  _exit(told ? 0 : 1);
}

// Returns nothing when the worker has died, or has not got so far yet.
std::optional<int> ReadReport(int report) {
  int number = 0;
  ssize_t got = 0;
  do {
    got = read(report, &number, sizeof number);
  } while (got < 0 && errno == EINTR);
  return got == sizeof number ? std::optional<int>(number) : std::nullopt;
}

// Leaves the worker to be reaped: as long as it is not, its id and group are nobody else's.
bool HasEnded(pid_t worker) {
  siginfo_t ended = {};
  return waitid(P_PID, static_cast<id_t>(worker), &ended, WEXITED | WNOHANG | WNOWAIT) == 0 &&
         ended.si_pid == worker;
}

int Reap(pid_t worker) {
  int status = 0;
  while (waitpid(worker, &status, 0) < 0 && errno == EINTR) {
  }
  return WIFSIGNALED(status) ? WTERMSIG(status) : 0;
}

// All at once: a run that saw only its children end would go on and send what they have.
void TerminateGroup(pid_t group) {
  kill(-group, SIGTERM);
  kill(-group, SIGCONT);  // also what is stopped
}

// What is left of the group after SIGTERM gets two seconds.
void AwaitGroupEnd(pid_t group) {
  for (int pause = 0; pause < kPausesBeforeKill; ++pause) {
    if (kill(-group, 0) != 0) {
      return;
    }
    nanosleep(&kPause, nullptr);
  }
  kill(-group, SIGKILL);
}

WorkerEnd AwaitEnd(pid_t worker, int report, const Signals& signals,
                   const std::function<void(pid_t)>& look) {
  WorkerEnd end;
  do {
    end.interrupted = signals.Await() != 0;
    look(worker);
  } while (!end.interrupted && !HasEnded(worker));
  if (!end.interrupted) {
    end.result = ReadReport(report);
  }
  const bool diedAtWork = !end.result.has_value();
  if (diedAtWork) {
    TerminateGroup(worker);
  }
  end.signal = Reap(worker);
  if (diedAtWork) {
    AwaitGroupEnd(worker);
  }
  return end;
}

}  // namespace

WorkerEnd RunInWorker(const std::function<int()>& work, const std::function<void(pid_t)>& look) {
  int report[2];
  if (pipe2(report, O_CLOEXEC) != 0) {
    Fail("cannot make a pipe");
  }
  const Signals signals;
  const pid_t worker = fork();
  if (worker < 0) {
    const int reason = errno;
    close(report[0]);
    close(report[1]);
    errno = reason;
    Fail("cannot start a process");
  }
  if (worker == 0) {
    close(report[0]);
    Work(work, signals, report[1]);
  }
  close(report[1]);
  ReadReport(report[0]);  // from here on the worker has a group
  // Its children hold the other end as well, so nothing may wait for that to be closed.
  fcntl(report[0], F_SETFL, O_NONBLOCK);
  const WorkerEnd end = AwaitEnd(worker, report[0], signals, look);
  close(report[0]);
  return end;
}

}  // namespace quendelctl
