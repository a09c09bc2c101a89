// Shows on the standard error output how something that takes its time is getting on.
#ifndef QUENDELCTL_PROGRESS_H_
#define QUENDELCTL_PROGRESS_H_

#include <chrono>
#include <optional>
#include <string>

#include "run_watch.h"

namespace quendelctl {

// A line that is drawn again and again on a terminal. Elsewhere there is none.
class ProgressLine {
 public:
  ProgressLine();
  bool is_shown() const { return redraws_; }
  // Whether it is time to draw it again, which it is a few times a second.
  bool IsDue() const;
  void Draw(const std::string& text);
  // Takes it off the terminal.
  void Finish();

 private:
  using Clock = std::chrono::steady_clock;

  const bool redraws_;
  std::optional<Clock::time_point> drawn_;
};

// Tells what is being waited for and how long already, once that is longer than a moment.
class WaitingLine {
 public:
  WaitingLine(std::string text, std::chrono::seconds limit);
  void Show();
  void Finish() { line_.Finish(); }

 private:
  const std::string text_;
  const std::chrono::seconds limit_;
  const std::chrono::steady_clock::time_point start_;
  ProgressLine line_;
};

// Follows a collection run: with such a line on a terminal, elsewhere with a line for each phase.
class Progress {
 public:
  Progress();
  // Shows the present state, if it is time to.
  void Show(const RunWatch& run);
  void Finish() { line_.Finish(); }

 private:
  const std::chrono::steady_clock::time_point start_;
  ProgressLine line_;
  std::optional<Phase> shown_;
};

}  // namespace quendelctl

#endif  // QUENDELCTL_PROGRESS_H_
