// The heartbeats: regular, but never in step with those of other devices.
#ifndef QUENDELD_HEARTBEAT_H_
#define QUENDELD_HEARTBEAT_H_

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <vector>

#include "context.h"
#include "service.h"

namespace quendeld {

class Heartbeat {
 public:
  // `accepted` is called after each one that the server accepted, with its actions; `failed` after
  // each that it did not.
  Heartbeat(const Context& context, Service& service,
            std::function<void(const Json::Value& actions)> accepted, std::function<void()> failed);

  // The first one comes at some time in the first minute.
  void Start();

  // Sends one now. `done`, when there is one, hears whether the server accepted it.
  void Now(std::function<void(bool accepted)> done);

  // Whether the last one was accepted.
  bool IsServerThere() const { return last_accepted_ > 0 && failures_ == 0; }

  int failures() const { return failures_; }
  int64_t last_accepted() const { return last_accepted_; }  // seconds since the epoch, or 0
  Duration next_in() const { return timer_.Left(); }

 private:
  void Beat();
  void Ended(const WorkerEnd& end);
  void Schedule();

  const Context context_;
  Service& service_;
  const std::function<void(const Json::Value&)> accepted_;
  const std::function<void()> failed_;
  Timer timer_;
  bool is_under_way_ = false;
  int failures_ = 0;
  int64_t last_accepted_ = 0;
  std::vector<std::function<void(bool)>> listeners_;
};

}  // namespace quendeld

#endif  // QUENDELD_HEARTBEAT_H_
