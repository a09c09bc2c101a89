// What the owner and the maker can set: "/usr/arvo/etc/quendeld.conf".
#ifndef QUENDELD_SETTINGS_H_
#define QUENDELD_SETTINGS_H_

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace quendeld {

using Duration = std::chrono::microseconds;

// Each field is the key of its name; docs/man/quendeld.conf.5 explains them.
struct Settings {
  Duration heartbeat_interval = std::chrono::seconds(600);
  int64_t heartbeat_jitter = 10;  // percent
  Duration heartbeat_backoff_limit = std::chrono::hours(1);
  Duration first_heartbeat_within = std::chrono::minutes(1);
  Duration collection_interval = std::chrono::hours(24);
  Duration collection_retry = std::chrono::minutes(10);
  Duration sample_interval = std::chrono::seconds(300);
  int64_t samples_kept = 288;

  Duration conversation_limit = std::chrono::minutes(2);
  Duration collection_limit = std::chrono::hours(1);
  Duration upload_limit = std::chrono::hours(1);
  Duration local_limit = std::chrono::minutes(1);
  Duration kill_after = std::chrono::seconds(5);
  int64_t memory_limit_mb = 512;  // 0 is none

  int64_t outbox_limit_mb = 256;
  int64_t free_space_mb = 32;
  Duration rotation_quiet = std::chrono::seconds(10);
  Duration rotation_wait = std::chrono::minutes(2);

  Duration session_limit = std::chrono::hours(24);
  int64_t actions_per_heartbeat = 20;
  int64_t request_ids_kept = 10000;
  int64_t events_kept = 1000;
  bool allow_power_actions = false;
};

inline constexpr char kSettingsFile[] = "/usr/arvo/etc/quendeld.conf";

// Reads settings from a text of key=value lines. What is wrong with a line is added to
// `complaints`; its key keeps the default.
Settings SettingsFromText(const std::string& text, std::vector<std::string>& complaints);

// Reads the settings' file. One that is missing gives the defaults, one that cannot be read gives
// them and a complaint.
Settings ReadSettings(const std::string& path, std::vector<std::string>& complaints);

}  // namespace quendeld

#endif  // QUENDELD_SETTINGS_H_
