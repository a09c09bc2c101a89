// How often somebody may do something.
#ifndef QUENDEL_DESK_RATE_LIMIT_H_
#define QUENDEL_DESK_RATE_LIMIT_H_

#include <mutex>
#include <string>
#include <unordered_map>

#include "connection_table.h"

namespace quendeldesk {

// Each key may do something `perMinute` times at once, and as often a minute in the long run. 0 is
// without limit.
class RateLimit {
 public:
  explicit RateLimit(unsigned perMinute) : most_(perMinute) {}

  // Returns false when it is too often.
  bool Allow(const std::string& key, Clock::time_point now);

 private:
  struct Bucket {
    double left;
    Clock::time_point since;
  };
  void DropFull(Clock::time_point now);

  const unsigned most_;
  std::mutex mutex_;
  std::unordered_map<std::string, Bucket> buckets_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_RATE_LIMIT_H_
