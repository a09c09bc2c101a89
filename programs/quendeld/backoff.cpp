#include "backoff.h"

#include <algorithm>
#include <random>

namespace quendeld {

Duration NextAttempt(Duration interval, int64_t jitter, Duration limit, int failures,
                     double chance) {
  if (failures <= 0) {
    const double share = static_cast<double>(jitter) / 100 * (2 * chance - 1);
    return interval + std::chrono::duration_cast<Duration>(interval * share);
  }
  const Duration most = std::max(interval, limit);
  Duration delay = interval;
  for (int failure = 0; failure < failures && delay < most; ++failure) {
    delay *= 2;
  }
  return std::chrono::duration_cast<Duration>(std::min(delay, most) * (0.5 + chance / 2));
}

double Chance() {
  static std::minstd_rand generator{std::random_device{}()};
  return std::uniform_real_distribution<double>(0, 1)(generator);
}

}  // namespace quendeld
