// Running programs.
#include "platform/process.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"
#include "platform/standalone/run_program.h"
#include "platform/standalone/started_program.h"

namespace platform {
namespace {

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

int Run(const std::vector<char*>& argv) {
  const StartedProgram program = StartProgram(argv, -1);
  return program ? WaitForStatus(program) : -1;
}

// The programs behind the streams that are open.
class StreamTable {
 public:
  void Set(FILE* stream, StartedProgram program) {
    const std::lock_guard<std::mutex> guard(mutex_);
    programs_[stream] = std::move(program);
  }

  // Returns no program for a stream that is not in the table.
  StartedProgram Remove(FILE* stream) {
    const std::lock_guard<std::mutex> guard(mutex_);
    const auto found = programs_.find(stream);
    if (found == programs_.end()) {
      return {};
    }
    StartedProgram program = std::move(found->second);
    programs_.erase(found);
    return program;
  }

 private:
  std::mutex mutex_;
  std::unordered_map<FILE*, StartedProgram> programs_;
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
  Streams().Set(stream.get(), {});
  StartedProgram program = StartProgram(argv, writeEnd.get());
  if (!program) {
    Streams().Remove(stream.get());
    return nullptr;
  }
  Streams().Set(stream.get(), std::move(program));
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
  const platform::StartedProgram program = platform::Streams().Remove(stream);
  if (!program) {
    return platform::FailForArgument();
  }
  fclose(stream);
  return platform::WaitForStatus(program);
}
