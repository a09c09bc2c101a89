// How often somebody may do something.
#include "rate_limit.h"

#include <algorithm>

namespace quendeldesk {
namespace {

constexpr size_t kMostKeys = 200'000;

}  // namespace

bool RateLimit::Allow(const std::string& key, Clock::time_point now) {
  if (most_ == 0) {
    return true;
  }
  const std::lock_guard<std::mutex> lock(mutex_);
  if (buckets_.size() >= kMostKeys) {
    DropFull(now);
  }
  Bucket& bucket = buckets_.try_emplace(key, Bucket{double(most_), now}).first->second;
  const double minutes = std::chrono::duration<double, std::ratio<60>>(now - bucket.since).count();
  bucket.left = std::min(double(most_), bucket.left + minutes * most_);
  bucket.since = now;
  if (bucket.left < 1) {
    return false;
  }
  --bucket.left;
  return true;
}

// Whoever has been silent for a minute has all of it again. Made-up names must not fill the memory,
// so where nobody has, everybody begins anew.
void RateLimit::DropFull(Clock::time_point now) {
  for (auto bucket = buckets_.begin(); bucket != buckets_.end();) {
    bucket = now - bucket->second.since > std::chrono::minutes(1) ? buckets_.erase(bucket)
                                                                  : std::next(bucket);
  }
  if (buckets_.size() >= kMostKeys) {
    buckets_.clear();
  }
}

}  // namespace quendeldesk
