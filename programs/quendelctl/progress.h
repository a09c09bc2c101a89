// Shows how a collection run is getting on.
#ifndef QUENDELCTL_PROGRESS_H_
#define QUENDELCTL_PROGRESS_H_

#include <chrono>
#include <optional>

#include "run_watch.h"

namespace quendelctl {

// Shows it on the standard error output: on a terminal as one line that is drawn again and again,
// elsewhere as a line for each phase.
class Progress {
 public:
  Progress();
  // Shows the present state, if it is time to.
  void Show(const RunWatch& run);
  // Takes the line off the terminal.
  void Finish();

 private:
  using Clock = std::chrono::steady_clock;

  void Redraw(const RunWatch& run);

  const bool redraws_;
  const Clock::time_point start_;
  std::optional<Clock::time_point> drawn_;
  std::optional<Phase> shown_;
};

}  // namespace quendelctl

#endif  // QUENDELCTL_PROGRESS_H_
