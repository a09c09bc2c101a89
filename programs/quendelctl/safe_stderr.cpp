// The standard error output, made safe to show on a terminal.
#include "safe_stderr.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "printable.h"

namespace quendelctl {
namespace {

constexpr size_t kBlockBytes = 4096;
constexpr int kLongestMessageBytes = 4 << 20;
constexpr char kEraseRest[] = "\x1b[K";

int rawStderr = STDERR_FILENO;

void WriteAll(int descriptor, std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(descriptor, text.data(), text.size());
    if (written < 0 && errno == EINTR) {
      continue;
    }
    if (written <= 0) {
      return;  // nobody looks at it any more
    }
    text.remove_prefix(static_cast<size_t>(written));
  }
}

void ComplainOfSystem(const char* what) {
  Complain(std::string(what) + ": " + strerror(errno));
}

// Makes what one call has written safe: a line, which may quote other lines.
std::string Safe(std::string_view message) {
  const bool ended = !message.empty() && message.back() == '\n';
  if (ended) {
    message.remove_suffix(1);
  }
  return Printable(message, "\t") + (ended ? "\n" : "");
}

// Returns the size of the next message, which stays where it is; 0 when none will come any more.
size_t AwaitMessage(int input) {
  char first = 0;
  ssize_t size = 0;
  do {
    size = recv(input, &first, 1, MSG_PEEK | MSG_TRUNC);
  } while (size < 0 && errno == EINTR);
  return size < 0 ? 0 : static_cast<size_t>(size);
}

void Show(int input, int output) {
  const std::string before = CanRedraw(output) ? kEraseRest : "";  // a progress line, for example
  std::string line;
  while (const size_t size = AwaitMessage(input)) {
    const size_t begun = line.size();
    line.resize(begun + size);
    const ssize_t got = recv(input, &line[begun], size, 0);
    line.resize(begun + (got < 0 ? 0 : static_cast<size_t>(got)));
    // The C library writes a long line in two: so many of its blocks, and the rest.
    if (size % kBlockBytes != 0) {
      WriteAll(output, before + Safe(line));
      line.clear();
    }
  }
  WriteAll(output, Safe(line));
}

// The filter ends when the last process that could write to it has ended, and not before: a key
// that interrupts the program must not take its last words away.
[[noreturn]] void RunFilter(int input, int output) {
  for (const int signalNumber : {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGPIPE}) {
    signal(signalNumber, SIG_IGN);
  }
  try {
    Show(input, output);
  } catch (...) {
    _exit(1);
  }
  _exit(0);
}

}  // namespace

SafeStderr::SafeStderr() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
    ComplainOfSystem("cannot make a pair of sockets");
    return;
  }
  for (const int option : {SO_SNDBUF, SO_SNDBUFFORCE}) {  // the second one is root's
    setsockopt(ends[1], SOL_SOCKET, option, &kLongestMessageBytes, sizeof kLongestMessageBytes);
  }
  Start(ends[0], ends[1]);
  close(ends[0]);
  close(ends[1]);
}

void SafeStderr::Start(int readEnd, int writeEnd) {
  original_ = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);
  if (original_ < 0) {
    ComplainOfSystem("cannot keep the standard error output");
    return;
  }
  filter_ = fork();
  if (filter_ < 0) {
    ComplainOfSystem("cannot start a process");
    return;
  }
  if (filter_ == 0) {
    close(STDOUT_FILENO);  // its reader must see the end while the program may still run
    close(writeEnd);
    RunFilter(readEnd, original_);
  }
  dup2(writeEnd, STDERR_FILENO);
  rawStderr = original_;
}

SafeStderr::~SafeStderr() {
  if (!works()) {
    return;
  }
  fflush(stderr);
  dup2(original_, STDERR_FILENO);
  rawStderr = STDERR_FILENO;
  close(original_);
  waitpid(filter_, nullptr, 0);
}

void Complain(const std::string& line) {
  Tell("quendelctl: " + line);
}

// One call, so that it stays one line. What is longer than any argument would not get through.
void Tell(const std::string& line) {
  constexpr size_t kMostBytes = 1 << 17;
  WriteAll(STDERR_FILENO, line.substr(0, kMostBytes) + "\n");
}

int RawStderr() {
  return rawStderr;
}

bool CanRedraw(int descriptor) {
  const char* terminal = getenv("TERM");
  return isatty(descriptor) == 1 && terminal != nullptr && strcmp(terminal, "dumb") != 0;
}

}  // namespace quendelctl
