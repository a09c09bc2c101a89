// The daemon's one loop: what waits for time, a descriptor or a signal.
//
// Times are those of CLOCK_BOOTTIME, so a wall clock that jumps starts and stops nothing. A
// callback that throws is logged and the loop goes on.
#ifndef QUENDELD_LOOP_H_
#define QUENDELD_LOOP_H_

#include <systemd/sd-event.h>

#include <functional>
#include <memory>
#include <vector>

#include "settings.h"

namespace quendeld {

struct SourceOff {
  void operator()(sd_event_source* source) const { sd_event_source_disable_unref(source); }
};
using Source = std::unique_ptr<sd_event_source, SourceOff>;

class Loop {
 public:
  // Throws std::system_error when the system has no loop left.
  Loop();
  ~Loop();
  Loop(const Loop&) = delete;
  Loop& operator=(const Loop&) = delete;

  // Runs until Quit(), then returns.
  void Run();
  void Quit();

  // Calls back once, after the callback that is running. For work that must not be done inside the
  // callback that found it.
  void Soon(std::function<void()> callback);

  sd_event* get() const { return event_; }

  // Now, as CLOCK_BOOTTIME counts.
  Duration Now() const;

 private:
  static int CallPutOff(sd_event_source* source, void* self);

  sd_event* event_ = nullptr;
  sd_event_source* put_off_source_ = nullptr;
  std::vector<std::function<void()>> put_off_;
};

// Calls back once, some time after each start.
class Timer {
 public:
  Timer(Loop& loop, std::function<void()> callback);
  Timer(const Timer&) = delete;
  Timer& operator=(const Timer&) = delete;

  // Starts, or starts anew. The call may come late by a hundredth of the time.
  void Start(Duration after);
  void Stop();
  bool is_running() const;
  Duration Left() const;  // 0 when it does not run

 private:
  static int Fire(sd_event_source* source, uint64_t when, void* self);

  Loop& loop_;
  const std::function<void()> callback_;
  Source source_;
};

// Calls back whenever a descriptor has something to read.
class Readable {
 public:
  Readable(Loop& loop, int descriptor, std::function<void()> callback);
  Readable(const Readable&) = delete;
  Readable& operator=(const Readable&) = delete;

 private:
  static int Fire(sd_event_source* source, int descriptor, uint32_t events, void* self);

  const std::function<void()> callback_;
  Source source_;
};

// Takes a signal, which must be blocked, from the loop.
class SignalSource {
 public:
  SignalSource(Loop& loop, int number, std::function<void()> callback);
  SignalSource(const SignalSource&) = delete;
  SignalSource& operator=(const SignalSource&) = delete;

 private:
  static int Fire(sd_event_source* source, const signalfd_siginfo* info, void* self);

  const std::function<void()> callback_;
  Source source_;
};

}  // namespace quendeld

#endif  // QUENDELD_LOOP_H_
