// The standard error output, made safe to show on a terminal.
#include "safe_stderr.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "printable.h"

namespace quendelctl {
namespace {

constexpr size_t kLongestPieceBytes = 65536;
constexpr char kEraseRest[] = "\x1b[K";

int rawStderr = STDERR_FILENO;

void Complain(const char* what) {
  fprintf(stderr, "quendelctl: %s: %s\n", what, strerror(errno));
}

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

// How much of the text can be shown now: whole lines, or much of a very long one up to the
// beginning of a character.
size_t ShowableBytes(const std::string& text) {
  const size_t lineEnd = text.rfind('\n');
  if (lineEnd != std::string::npos) {
    return lineEnd + 1;
  }
  if (text.size() < kLongestPieceBytes) {
    return 0;
  }
  size_t end = text.size() - 4;
  while (end < text.size() && (static_cast<unsigned char>(text[end]) & 0xC0) == 0x80) {
    ++end;
  }
  return end;
}

void Show(int input, int output) {
  constexpr char kKept[] = "\n\t";
  const std::string before = CanRedraw(output) ? kEraseRest : "";  // a progress line, for example
  std::string pending;
  char chunk[4096];
  for (;;) {
    const ssize_t got = read(input, chunk, sizeof(chunk));
    if (got < 0 && errno == EINTR) {
      continue;
    }
    if (got <= 0) {
      break;
    }
    pending.append(chunk, static_cast<size_t>(got));
    const size_t showable = ShowableBytes(pending);
    if (showable > 0) {
      WriteAll(output, before + Printable(std::string_view(pending).substr(0, showable), kKept));
    }
    pending.erase(0, showable);
  }
  WriteAll(output, Printable(pending, kKept));
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
  if (pipe2(ends, O_CLOEXEC) != 0) {
    Complain("cannot make a pipe");
    return;
  }
  Start(ends[0], ends[1]);
  close(ends[0]);
  close(ends[1]);
}

void SafeStderr::Start(int readEnd, int writeEnd) {
  original_ = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);
  if (original_ < 0) {
    Complain("cannot keep the standard error output");
    return;
  }
  filter_ = fork();
  if (filter_ < 0) {
    Complain("cannot start a process");
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

int RawStderr() {
  return rawStderr;
}

bool CanRedraw(int descriptor) {
  const char* terminal = getenv("TERM");
  return isatty(descriptor) == 1 && terminal != nullptr && strcmp(terminal, "dumb") != 0;
}

}  // namespace quendelctl
