#include "worker.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <vector>

#include "json.h"

namespace quendeld {
namespace {

constexpr Duration kLookEvery = std::chrono::milliseconds(50);

// The two ends of a pipe that holds a whole message.
struct Pipe {
  int read = -1;
  int write = -1;
};

Pipe MakePipe() {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC | O_NONBLOCK) != 0) {
    return {};
  }
  fcntl(ends[1], F_SETPIPE_SZ, kPipeBytes);
  return {ends[0], ends[1]};
}

void Close(int& descriptor) {
  if (descriptor >= 0) {
    close(descriptor);
    descriptor = -1;
  }
}

// The environment of this process, and the mark.
std::vector<char*> MarkedEnvironment() {
  static std::string mark = kWorkerMark;
  std::vector<char*> variables;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    variables.push_back(*variable);
  }
  variables.push_back(mark.data());
  variables.push_back(nullptr);
  return variables;
}

// Starts a program with the two pipes as its standard input and output. It leads a session and has
// every signal at its default action and none blocked. Returns an error number.
int Spawn(const std::string& program, bool foreground, int input, int output, pid_t& process) {
  posix_spawn_file_actions_t files;
  posix_spawn_file_actions_init(&files);
  posix_spawn_file_actions_adddup2(&files, input, STDIN_FILENO);
  posix_spawn_file_actions_adddup2(&files, output, STDOUT_FILENO);
  posix_spawn_file_actions_addclosefrom_np(&files, STDERR_FILENO + 1);
  sigset_t none;
  sigset_t all;
  sigemptyset(&none);
  sigfillset(&all);
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  posix_spawnattr_setflags(
      &attributes,
      static_cast<short>(POSIX_SPAWN_SETSID | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF));
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setsigdefault(&attributes, &all);
  std::string name = program;
  std::string option = "--foreground";
  char* const arguments[] = {name.data(), foreground ? option.data() : nullptr, nullptr};
  const int error = posix_spawn(&process, program.c_str(), &files, &attributes, arguments,
                                MarkedEnvironment().data());
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&files);
  return error;
}

std::string DescribeEnd(const siginfo_t& end) {
  if (end.si_code == CLD_EXITED) {
    return "the worker ended with status " + std::to_string(end.si_status) + " and no answer";
  }
  return std::string("the worker was ended by signal ") + std::to_string(end.si_status) + " (" +
         strsignal(end.si_status) + ")";
}

}  // namespace

Worker::Worker(Loop& loop, const WorkerSetup& setup, const std::string& request,
               std::function<void(const WorkerEnd&)> ended)
    : loop_(loop),
      setup_(setup),
      ended_(std::move(ended)),
      group_(setup.name),
      timer_(loop, [this] { Escalate(); }) {
  Start(request);
}

Worker::~Worker() {
  if (process_ > 0) {  // the daemon itself ends
    SignalSession(process_, SIGKILL);
    group_.Kill();
    waitpid(process_, nullptr, 0);
  }
  exit_.reset();
  Close(process_descriptor_);
  Close(request_pipe_);
  Close(answer_pipe_);
}

void Worker::Start(const std::string& request) {
  Pipe input = MakePipe();
  Pipe output = MakePipe();
  request_pipe_ = input.write;
  answer_pipe_ = output.read;
  // The worker waits for its request, and writes its answer, in peace.
  fcntl(input.read, F_SETFL, 0);
  fcntl(output.write, F_SETFL, 0);
  const int error = input.read < 0 || output.read < 0 ? errno
                                                      : Spawn(setup_.program, setup_.foreground,
                                                              input.read, output.write, process_);
  Close(input.read);
  Close(output.write);
  if (error != 0) {
    process_ = -1;
    end_.reason = "cannot start " + setup_.program + ": " + strerror(error);
    loop_.Soon([this] { Report(); });
    return;
  }
  process_descriptor_ = static_cast<int>(syscall(SYS_pidfd_open, process_, 0));
  exit_ = std::make_unique<Readable>(loop_, process_descriptor_, [this] { LeaderEnded(); });
  timer_.Start(setup_.time_limit);
  group_.Add(process_);
  LimitMemory();
  HandOver(request);
}

// Before the request is there, so that there is no moment without the limit. The memory checks of a
// build reserve more than any limit.
void Worker::LimitMemory() const {
#ifndef __SANITIZE_ADDRESS__
  if (setup_.memory_limit_mb > 0) {
    const rlim_t bytes = static_cast<rlim_t>(setup_.memory_limit_mb) << 20;
    const rlimit limit = {bytes, bytes};
    prlimit(process_, RLIMIT_DATA, &limit, nullptr);
  }
#endif
}

void Worker::HandOver(const std::string& request) {
  const std::string line = request + "\n";
  if (write(request_pipe_, line.data(), line.size()) != static_cast<ssize_t>(line.size())) {
    End("the request of " + std::to_string(line.size()) + " bytes does not fit its pipe");
  }
  Close(request_pipe_);
}

void Worker::End(const std::string& reason) {
  if (end_.reason.empty()) {
    end_.reason = reason;
  }
  if (process_ > 0 && exit_) {
    SignalSession(process_, SIGTERM);
    timer_.Start(setup_.kill_after);
    is_killed_ = true;
  }
}

// The first time the time limit is over, and then the time to end in peace.
void Worker::Escalate() {
  if (!exit_) {
    EndFollowers();
  } else if (is_killed_) {
    SignalSession(process_, SIGKILL);
    group_.Kill();
    timer_.Start(setup_.kill_after);
  } else {
    End("the worker did not answer within " + setup_.limit + " s");
  }
}

// The leader is not reaped before its session has ended, so that its id stays its own.
void Worker::LeaderEnded() {
  exit_.reset();
  siginfo_t end = {};
  waitid(P_PID, static_cast<id_t>(process_), &end, WEXITED | WNOHANG | WNOWAIT);
  const std::optional<Json::Value> answer = JsonFromText(ReadAnswer());
  if (end_.reason.empty() && answer && answer->isObject()) {
    end_.answered = true;
    end_.answer = *answer;
  } else if (end_.reason.empty()) {
    end_.reason = DescribeEnd(end);
  }
  EndFollowers();
}

// Whatever the leader left behind is asked to end, and made to when it does not.
void Worker::EndFollowers() {
  if (Followers(process_).empty() && group_.IsEmpty()) {
    timer_.Stop();
    Report();
    return;
  }
  const bool isTooLate = looks_ * kLookEvery >= setup_.kill_after;
  const bool isHopeless = looks_ * kLookEvery >= 4 * setup_.kill_after;
  if (isHopeless) {
    syslog(LOG_ERR, "a process of worker %d does not end, not even by SIGKILL", process_);
    Report();
    return;
  }
  if (looks_ == 0) {
    SignalSession(process_, SIGTERM);
  } else if (isTooLate) {
    SignalSession(process_, SIGKILL);
    group_.Kill();
  }
  ++looks_;
  timer_.Start(kLookEvery);
}

void Worker::Report() {
  if (process_ > 0) {
    waitpid(process_, nullptr, 0);
    process_ = -1;
  }
  const std::function<void(const WorkerEnd&)> ended = ended_;
  const WorkerEnd end = end_;
  ended(end);  // which may be the end of this object
}

std::string Worker::ReadAnswer() const {
  std::string text;
  char part[8192];
  ssize_t got = 0;
  while ((got = read(answer_pipe_, part, sizeof part)) > 0 || (got < 0 && errno == EINTR)) {
    text.append(part, static_cast<size_t>(got < 0 ? 0 : got));
  }
  const size_t end = text.find('\n');
  return end == std::string::npos ? "" : text.substr(0, end);
}

}  // namespace quendeld
