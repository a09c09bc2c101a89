#include "loop.h"

#include <syslog.h>

#include <algorithm>
#include <ctime>
#include <exception>
#include <system_error>
#include <utility>

namespace quendeld {
namespace {

void Check(int result, const char* what) {
  if (result < 0) {
    throw std::system_error(-result, std::generic_category(), what);
  }
}

// No exception may pass through the loop's C frames.
void Guarded(const std::function<void()>& callback) noexcept {
  try {
    callback();
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "a step was given up: %s", error.what());
  }
}

Source Own(sd_event_source* source) {
  return Source(source);
}

}  // namespace

Loop::Loop() {
  Check(sd_event_new(&event_), "cannot make an event loop");
  Check(sd_event_add_defer(event_, &put_off_source_, CallPutOff, this),
        "cannot make an event loop");
  sd_event_source_set_enabled(put_off_source_, SD_EVENT_OFF);
}

Loop::~Loop() {
  sd_event_source_disable_unref(put_off_source_);
  sd_event_unref(event_);
}

void Loop::Run() {
  Check(sd_event_loop(event_), "the event loop failed");
}

void Loop::Quit() {
  sd_event_exit(event_, 0);
}

void Loop::Soon(std::function<void()> callback) {
  put_off_.push_back(std::move(callback));
  sd_event_source_set_enabled(put_off_source_, SD_EVENT_ONESHOT);
}

int Loop::CallPutOff(sd_event_source* /*source*/, void* self) {
  const std::vector<std::function<void()>> callbacks =
      std::exchange(static_cast<Loop*>(self)->put_off_, {});
  for (const std::function<void()>& callback : callbacks) {
    Guarded(callback);
  }
  return 0;
}

Duration Loop::Now() const {
  timespec now = {};
  clock_gettime(CLOCK_BOOTTIME, &now);
  return std::chrono::duration_cast<Duration>(std::chrono::seconds(now.tv_sec) +
                                              std::chrono::nanoseconds(now.tv_nsec));
}

Timer::Timer(Loop& loop, std::function<void()> callback)
    : loop_(loop), callback_(std::move(callback)) {
}

void Timer::Start(Duration after) {
  const Duration accuracy = std::max<Duration>(after / 100, std::chrono::milliseconds(1));
  const uint64_t when = static_cast<uint64_t>((loop_.Now() + after).count());
  sd_event_source* source = nullptr;
  Check(sd_event_add_time(loop_.get(), &source, CLOCK_BOOTTIME, when,
                          static_cast<uint64_t>(accuracy.count()), Fire, this),
        "cannot start a timer");
  source_ = Own(source);
}

void Timer::Stop() {
  source_.reset();
}

bool Timer::is_running() const {
  return source_ != nullptr;
}

Duration Timer::Left() const {
  uint64_t when = 0;
  if (!source_ || sd_event_source_get_time(source_.get(), &when) < 0) {
    return Duration::zero();
  }
  return std::max(Duration::zero(), Duration(static_cast<int64_t>(when)) - loop_.Now());
}

int Timer::Fire(sd_event_source* /*source*/, uint64_t /*when*/, void* self) {
  auto* timer = static_cast<Timer*>(self);
  timer->source_.reset();
  // A copy, as the callback may be the end of this object.
  const std::function<void()> callback = timer->callback_;
  Guarded(callback);
  return 0;
}

Readable::Readable(Loop& loop, int descriptor, std::function<void()> callback)
    : callback_(std::move(callback)) {
  constexpr uint32_t kInput = 1;  // EPOLLIN
  sd_event_source* source = nullptr;
  Check(sd_event_add_io(loop.get(), &source, descriptor, kInput, Fire, this),
        "cannot watch a descriptor");
  source_ = Own(source);
}

int Readable::Fire(sd_event_source* /*source*/, int /*descriptor*/, uint32_t /*events*/,
                   void* self) {
  // A copy, as the callback may be the end of this object.
  const std::function<void()> callback = static_cast<Readable*>(self)->callback_;
  Guarded(callback);
  return 0;
}

SignalSource::SignalSource(Loop& loop, int number, std::function<void()> callback)
    : callback_(std::move(callback)) {
  sd_event_source* source = nullptr;
  Check(sd_event_add_signal(loop.get(), &source, number, Fire, this), "cannot take a signal");
  source_ = Own(source);
}

int SignalSource::Fire(sd_event_source* /*source*/, const signalfd_siginfo* /*info*/, void* self) {
  Guarded(static_cast<SignalSource*>(self)->callback_);
  return 0;
}

}  // namespace quendeld
