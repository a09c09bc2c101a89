// A process of its own for whatever may hang, grow or end more than itself.
#include "worker.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <ctime>
#include <system_error>

namespace quendelctl {
namespace {

using Clock = std::chrono::steady_clock;

constexpr int kLookEveryMilliseconds = 20;
constexpr timespec kPause = {0, 20'000'000};
constexpr int kPausesBeforeKill = 100;

// What the worker gets when its parent has died.
constexpr int kOrphaned = SIGUSR1;

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
    queue_ = signalfd(-1, &awaited_, SFD_CLOEXEC | SFD_NONBLOCK);
    if (queue_ < 0) {
      Fail("cannot wait for signals");
    }
    signal(SIGCHLD, SIG_DFL);  // ignored, it would take the worker's end away
    sigprocmask(SIG_BLOCK, &awaited_, &before_);
  }
  ~Signals() {
    while (Take() > 0) {
    }
    close(queue_);
    sigprocmask(SIG_SETMASK, &before_, nullptr);
  }
  Signals(const Signals&) = delete;
  Signals& operator=(const Signals&) = delete;

  // Readable when there is one.
  int queue() const { return queue_; }

  // Returns the next one, or 0.
  int Take() const {
    signalfd_siginfo signal = {};
    return read(queue_, &signal, sizeof signal) == sizeof signal
               ? static_cast<int>(signal.ssi_signo)
               : 0;
  }

  // Tells whether one has come that asks this program to end.
  bool AskToEnd() const {
    int number = 0;
    while ((number = Take()) == SIGCHLD) {
    }
    return number != 0;
  }

  // A run has to die of SIGTERM: one that lives on would wait for children that it never had.
  void RestoreForWorker() const {
    sigset_t mask = before_;
    for (const int number : {SIGTERM, SIGCHLD, kOrphaned}) {
      sigdelset(&mask, number);
    }
    signal(SIGTERM, SIG_DFL);
    sigprocmask(SIG_SETMASK, &mask, nullptr);
  }

 private:
  sigset_t awaited_;
  sigset_t before_;
  int queue_ = -1;
};

void EndOwnGroup(int /*number*/) {
  kill(0, SIGKILL);
}

// All that the worker starts stays in its group, and whoever could end it in good order is gone.
void DieWithParent(pid_t parent) {
  signal(kOrphaned, EndOwnGroup);
  if (prctl(PR_SET_PDEATHSIG, kOrphaned) != 0 || getppid() != parent) {
    _exit(1);
  }
}

// Not of the address space: there are runtimes that reserve much of it.
void LimitMemory([[maybe_unused]] uint64_t bytes) {
#ifndef __SANITIZE_ADDRESS__
  const rlimit limit = {bytes, bytes};
  setrlimit(RLIMIT_DATA, &limit);
#endif
}

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

bool WriteAll(int descriptor, const char* data, size_t size) {
  while (size > 0) {
    const ssize_t written = write(descriptor, data, size);
    if (written < 0 && errno != EINTR) {
      return false;
    }
    if (written > 0) {
      data += written;
      size -= static_cast<size_t>(written);
    }
  }
  return true;
}

// Tells the parent with one byte that the group is there, and at the end the report and its size.
[[noreturn]] void Work(const std::function<std::string()>& work, const WorkerLimits& limits,
                       const Signals& signals, pid_t parent, int report) noexcept {
  setsid();
  DieWithParent(parent);
  signals.RestoreForWorker();
  CloseStandardStreams();
  LimitMemory(limits.memory_bytes);
  bool told = WriteAll(report, "", 1);
  const std::string text = work();
  const uint64_t size = text.size();
  told = told && WriteAll(report, reinterpret_cast<const char*>(&size), sizeof size) &&
         WriteAll(report, text.data(), text.size());
  _exit(told ? 0 : 1);
}

// The parent's end of the pipe. The worker's children hold the other end as well, so nothing may
// wait for that to be closed.
class Report {
 public:
  explicit Report(int pipe) : pipe_(pipe) {}
  ~Report() { close(pipe_); }
  Report(const Report&) = delete;
  Report& operator=(const Report&) = delete;

  // Returns once the worker has a group, or has died before.
  void AwaitStart() const {
    char started = 0;
    while (read(pipe_, &started, 1) < 0 && errno == EINTR) {
    }
    fcntl(pipe_, F_SETFL, O_NONBLOCK);
  }

  // -1 when nothing more will come.
  int pipe() const { return ended_ ? -1 : pipe_; }

  void ReadOn() {
    char chunk[65536];
    ssize_t got = 0;
    while ((got = read(pipe_, chunk, sizeof chunk)) > 0) {
      bytes_.append(chunk, static_cast<size_t>(got));
    }
    ended_ = ended_ || got == 0;
  }

  // The report, if it is whole.
  std::optional<std::string> Text() const {
    uint64_t size = 0;
    if (bytes_.size() < sizeof size) {
      return std::nullopt;
    }
    memcpy(&size, bytes_.data(), sizeof size);
    return bytes_.size() - sizeof size == size ? std::optional(bytes_.substr(sizeof size))
                                               : std::nullopt;
  }

 private:
  const int pipe_;
  bool ended_ = false;
  std::string bytes_;
};

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

void AwaitNews(const Signals& signals, const Report& report) {
  pollfd sources[] = {{signals.queue(), POLLIN, 0}, {report.pipe(), POLLIN, 0}};
  poll(sources, 2, kLookEveryMilliseconds);
}

WorkerEnd AwaitEnd(pid_t worker, Report& report, const Signals& signals, Clock::time_point deadline,
                   const std::function<void(pid_t)>& look) {
  WorkerEnd end;
  bool ended = false;
  while (!ended && !end.interrupted && !end.timed_out) {
    AwaitNews(signals, report);
    ended = HasEnded(worker);  // before the last look at what it reported
    report.ReadOn();
    end.interrupted = signals.AskToEnd() && !ended;
    end.timed_out = !ended && Clock::now() >= deadline;
    look(worker);
  }
  if (ended) {
    end.report = report.Text();
  }
  TerminateGroup(worker);
  end.signal = Reap(worker);
  AwaitGroupEnd(worker);
  return end;
}

}  // namespace

WorkerEnd RunInWorker(const WorkerLimits& limits, const std::function<std::string()>& work,
                      const std::function<void(pid_t)>& look) {
  const Clock::time_point deadline = Clock::now() + limits.time;
  const Signals signals;
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) {
    Fail("cannot make a pipe");
  }
  const pid_t parent = getpid();
  const pid_t worker = fork();
  if (worker == 0) {
    close(ends[0]);
    Work(work, limits, signals, parent, ends[1]);
  }
  const int reason = errno;
  close(ends[1]);
  Report report(ends[0]);
  if (worker < 0) {
    errno = reason;
    Fail("cannot start a process");
  }
  report.AwaitStart();
  return AwaitEnd(worker, report, signals, deadline, look);
}

}  // namespace quendelctl
