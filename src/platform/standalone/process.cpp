// Running programs.
#include "platform/process.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstring>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"
#include "platform/standalone/run_program.h"

namespace platform {
namespace {

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

// An argument vector of the program and what follows it up to a null pointer. posix_spawn() takes
// pointers to non-const for the sake of old callers; it does not write there.
class Arguments {
 public:
  explicit Arguments(const char* program) { Add(program); }
  void Add(const char* argument) { argv_.push_back(const_cast<char*>(argument)); }
  void AddAll(va_list arguments) {
    // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): every caller has started the list.
    while (const char* next = va_arg(arguments, const char*)) {
      Add(next);
    }
  }
  const std::vector<char*>& Finish() {
    argv_.push_back(nullptr);
    return argv_;
  }

 private:
  std::vector<char*> argv_;
};

// Returns the child's id, or -1 with errno and the last error set.
pid_t Start(const std::vector<char*>& argv, int output) {
  SpawnPlan plan;
  plan.ResetSignals();
  pid_t child = -1;
  int error = plan.SetStreams(output);
  if (error == 0) {
    error = plan.Start(&child, argv);
  }
  if (error != 0) {
    errno = error;
    return Fail(kErrorNotStarted);
  }
  return child;
}

int WaitForStatus(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) {
      return Fail(kErrorStatusLost);
    }
  }
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

int Run(const std::vector<char*>& argv) {
  const pid_t child = Start(argv, -1);
  return child < 0 ? -1 : WaitForStatus(child);
}

// The programs behind the streams that are open.
class StreamTable {
 public:
  void Set(FILE* stream, pid_t child) {
    const std::lock_guard<std::mutex> guard(mutex_);
    children_[stream] = child;
  }

  // Returns the child's id, or -1 for a stream that is not in the table.
  pid_t Remove(FILE* stream) {
    const std::lock_guard<std::mutex> guard(mutex_);
    const auto found = children_.find(stream);
    if (found == children_.end()) {
      return -1;
    }
    const pid_t child = found->second;
    children_.erase(found);
    return child;
  }

 private:
  std::mutex mutex_;
  std::unordered_map<FILE*, pid_t> children_;
};

StreamTable& Streams() {
  static StreamTable streams;
  return streams;
}

void CloseStream(FILE* stream) {
  const int reason = errno;
  fclose(stream);
  errno = reason;
}

FILE* OpenStream(const std::vector<char*>& argv) {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) {
    Fail(kErrorNotStarted);
    return nullptr;
  }
  // The child opens /dev/null as 0 before it makes the write end its 1, so the write end must not
  // be 0. It never is, even where this process has closed 0: the read end gets the lower number.
  OwnedFd readEnd(ends[0]);
  const OwnedFd writeEnd(ends[1]);
  std::unique_ptr<FILE, void (*)(FILE*)> stream(fdopen(readEnd.get(), "r"), CloseStream);
  if (!stream) {
    Fail(kErrorNoMemory);
    return nullptr;
  }
  readEnd.Release();
  // Once the stream has its place in the table nothing can fail behind the start.
  Streams().Set(stream.get(), -1);
  const pid_t child = Start(argv, writeEnd.get());
  if (child < 0) {
    Streams().Remove(stream.get());
    return nullptr;
  }
  Streams().Set(stream.get(), child);
  return stream.release();
}

}  // namespace

int RunProgram(std::initializer_list<const char*> arguments) {
  Arguments vector(*arguments.begin());
  for (auto next = arguments.begin() + 1; next != arguments.end(); ++next) {
    vector.Add(*next);
  }
  return Run(vector.Finish());
}

}  // namespace platform

int ALIBCProcForkEx(int /*flags*/) {
  const pid_t child = fork();
  return child < 0 ? platform::Fail(platform::kErrorNotStarted) : child;
}

int ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3,
              const char* a4) try {
  if (program == nullptr) {
    return platform::FailForArgument();
  }
  platform::Arguments arguments(program);
  for (const char* argument : {a1, a2, a3, a4}) {
    if (argument == nullptr) {
      break;
    }
    arguments.Add(argument);
  }
  return platform::Run(arguments.Finish());
} catch (...) {
  return platform::FailForException();
}

// NOLINTNEXTLINE(cert-dcl50-cpp): the platform's interface is variadic.
int ALIBCExecl(const char* program, int flags, ...) try {
  if (program == nullptr) {
    return platform::FailForArgument();
  }
  platform::Arguments arguments(program);
  va_list rest;
  va_start(rest, flags);
  arguments.AddAll(rest);
  va_end(rest);
  return platform::Run(arguments.Finish());
} catch (...) {
  return platform::FailForException();
}

// NOLINTNEXTLINE(cert-dcl50-cpp): the platform's interface is variadic.
FILE* ALIBCPopen(const char* program, const char* mode, ...) try {
  if (program == nullptr || mode == nullptr || strcmp(mode, "r") != 0) {
    platform::FailForArgument();
    return nullptr;
  }
  platform::Arguments arguments(program);
  va_list rest;
  va_start(rest, mode);
  arguments.AddAll(rest);
  va_end(rest);
  return platform::OpenStream(arguments.Finish());
} catch (...) {
  platform::FailForException();
  return nullptr;
}

int ALIBCPclose(FILE* stream) {
  const pid_t child = platform::Streams().Remove(stream);
  if (child < 0) {
    return platform::FailForArgument();
  }
  fclose(stream);
  return platform::WaitForStatus(child);
}
