// Shows how a collection run is getting on.
#include "progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdio>
#include <string>

#include "safe_stderr.h"

namespace quendelctl {
namespace {

constexpr std::chrono::milliseconds kRedrawEvery(200);

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

Progress::Progress() : redraws_(CanRedraw(RawStderr())), start_(Clock::now()) {
}

void Progress::Show(const RunWatch& run) {
  if (redraws_) {
    if (!drawn_ || Clock::now() - *drawn_ >= kRedrawEvery) {
      Redraw(run);
      drawn_ = Clock::now();
    }
  } else if (shown_ != run.phase()) {
    fprintf(stderr, "quendelctl: %s\n", PhaseName(run.phase()));
  }
  shown_ = run.phase();
}

void Progress::Finish() {
  if (drawn_) {
    WriteOnce(RawStderr(), "\r\x1b[K");
  }
}

// The cursor goes back to the beginning of the line, so that a log line takes its place.
void Progress::Redraw(const RunWatch& run) {
  const auto elapsed = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - start_);
  const std::string text = Describe(run, elapsed).substr(0, Columns(RawStderr()));
  WriteOnce(RawStderr(), "\r" + text + "\x1b[K\r");
}

}  // namespace quendelctl
