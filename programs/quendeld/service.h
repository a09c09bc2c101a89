// Whether the service may talk to its server, and what it knows of its device.
#ifndef QUENDELD_SERVICE_H_
#define QUENDELD_SERVICE_H_

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "context.h"

namespace quendeld {

// The events, by their numbers on the wire.
inline constexpr int kEventEnable = 0;
inline constexpr int kEventDisable = 1;
inline constexpr int kEventPoweroff = 2;
inline constexpr int kEventReboot = 3;
inline constexpr int kEventLogout = 4;
inline constexpr int kEventUpdateInfo = 5;

class Service {
 public:
  explicit Service(const Context& context);

  // Called after each change: of the switch, of the pause, of the facts.
  void OnChange(std::function<void()> callback) { changed_ = std::move(callback); }

  // Takes what a worker found out, and queues the events that tell the server of a change.
  void Learn(const Json::Value& facts);

  // Asks for the facts.
  void Look();

  // A pause outlives a restart.
  void Pause(bool paused);

  // Nothing but the report that the service was disabled leaves the device unless this is true.
  bool MayTalk() const { return enabled_ == true && !paused_; }

  std::optional<bool> enabled() const { return enabled_; }
  bool paused() const { return paused_; }
  const std::string& host() const { return host_; }
  // When the support session that is open was opened, in seconds since the epoch.
  std::optional<int64_t> session() const { return session_; }

 private:
  void LearnSwitch(bool enabled, const Json::Value& info);
  void LearnInfo(const Json::Value& facts);
  void Queue(int event, const Json::Value& info, const std::string& key, const std::string& value);

  const Context context_;
  std::function<void()> changed_;
  std::optional<bool> enabled_;
  bool paused_ = false;
  std::string host_;
  std::optional<int64_t> session_;
};

}  // namespace quendeld

#endif  // QUENDELD_SERVICE_H_
