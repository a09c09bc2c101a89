// What the device is, and what its logs have gained.
#ifndef QUENDEL_WORKER_DEVICE_FACTS_H_
#define QUENDEL_WORKER_DEVICE_FACTS_H_

#include <json/value.h>

#include <cstdint>
#include <string>
#include <vector>

namespace quendel_worker {

// {"enabled", "host", "contact", "info": {"model", "version", "hostname", "serial"}, "session"}:
// "session" is there while a support session is open, and the second in which it was opened.
Json::Value DeviceFacts();

// One collected log.
struct LogState {
  std::string conf;  // path of its settings file
  std::string name;
  std::string path;
  uint64_t lag = 0;          // bytes of the live log that were not collected
  uint64_t archive_lag = 0;  // bytes of the archives that were not
  bool is_at_risk = false;   // the oldest archive was not: the next rotation may remove it
  bool is_stuck = false;     // it was collected without a whole line, and has one now
  bool has_line = false;     // it holds a whole line, or is not there
};

// Reads the settings and looks at the files of every log collector.
std::vector<LogState> LogStates();

}  // namespace quendel_worker

#endif  // QUENDEL_WORKER_DEVICE_FACTS_H_
