// Shows on the standard error output how something that takes its time is getting on.
#include "progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <utility>

#include "safe_stderr.h"

namespace quendelctl {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kRedrawEvery(200);
constexpr std::chrono::seconds kMoment(1);

std::chrono::seconds SecondsSince(Clock::time_point start) {
  return std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - start);
}

std::string InUnits(uint64_t bytes) {
  if (bytes < 1000) {
    return std::to_string(bytes) + " B";
  }
  constexpr const char* kUnits[] = {"kB", "MB", "GB", "TB", "PB", "EB"};
  double value = static_cast<double>(bytes) / 1000;
  const char* const* unit = kUnits;
  while (value >= 999.95) {
    value /= 1000;
    ++unit;
  }
  char text[32];
  snprintf(text, sizeof(text), "%.1f %s", value, *unit);
  return text;
}

std::string Describe(const RunWatch& run, std::chrono::seconds elapsed) {
  std::string text = PhaseName(run.phase());
  if (!run.Directory().empty()) {
    text += ": " + std::to_string(run.Logs(0).size()) + " of " +
            std::to_string(run.CountInstalledLogs()) + " logs, " + InUnits(run.BytesSoFar());
    if (const auto bytes = run.ArchiveBytes()) {
      text += ", archive " + InUnits(*bytes);
    }
    text += ", " + std::to_string(elapsed.count()) + " s";
  } else {
    text += ": " + std::to_string(elapsed.count()) + " s";
  }
  return text;
}

// One less than there are, because some terminals wrap after the last.
size_t Columns(int terminal) {
  constexpr size_t kUsual = 80;
  winsize size = {};
  const bool known = ioctl(terminal, TIOCGWINSZ, &size) == 0 && size.ws_col > 1;
  return (known ? size.ws_col : kUsual) - 1;
}

void WriteOnce(int terminal, const std::string& text) {
  if (write(terminal, text.data(), text.size()) < 0) {
    return;  // the next line will do
  }
}

}  // namespace

ProgressLine::ProgressLine() : redraws_(CanRedraw(RawStderr())) {
}

bool ProgressLine::IsDue() const {
  return redraws_ && (!drawn_ || Clock::now() - *drawn_ >= kRedrawEvery);
}

// The cursor goes back to the beginning of the line, so that a log line takes its place.
void ProgressLine::Draw(const std::string& text) {
  WriteOnce(RawStderr(), "\r" + text.substr(0, Columns(RawStderr())) + "\x1b[K\r");
  drawn_ = Clock::now();
}

void ProgressLine::Finish() {
  if (drawn_) {
    WriteOnce(RawStderr(), "\r\x1b[K");
    drawn_.reset();
  }
}

WaitingLine::WaitingLine(std::string text, std::chrono::seconds limit)
    : text_(std::move(text)), limit_(limit), start_(Clock::now()) {
}

void WaitingLine::Show() {
  const std::chrono::seconds elapsed = SecondsSince(start_);
  if (elapsed >= kMoment && line_.IsDue()) {
    line_.Draw(text_ + ": " + std::to_string(elapsed.count()) + " s of at most " +
               std::to_string(limit_.count()) + " s");
  }
}

Progress::Progress() : start_(Clock::now()) {
}

void Progress::Show(const RunWatch& run) {
  if (line_.IsDue()) {
    line_.Draw(Describe(run, SecondsSince(start_)));
  } else if (!line_.is_shown() && shown_ != run.phase()) {
    Complain(PhaseName(run.phase()));
  }
  shown_ = run.phase();
}

}  // namespace quendelctl
