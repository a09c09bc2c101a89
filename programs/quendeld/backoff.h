// When to try again: the one place that says how waiting times grow and vary.
#ifndef QUENDELD_BACKOFF_H_
#define QUENDELD_BACKOFF_H_

#include "settings.h"

namespace quendeld {

// The time from one attempt to the next. `chance` is a random number from 0 to 1. After a success
// that is `interval`, more or less by `jitter` percent. After `failures` failures in a row it is
// doubled for each, up to `limit` (but at least `interval`), of which between a half and all
// counts.
Duration NextAttempt(Duration interval, int64_t jitter, Duration limit, int failures,
                     double chance);

// Returns a random number from 0 to 1.
double Chance();

}  // namespace quendeld

#endif  // QUENDELD_BACKOFF_H_
