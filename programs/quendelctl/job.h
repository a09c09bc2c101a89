// What a command does in a worker.
#ifndef QUENDELCTL_JOB_H_
#define QUENDELCTL_JOB_H_

#include <functional>
#include <string>

#include "command.h"
#include "worker.h"

namespace quendelctl {

// Runs the job in a worker and returns what came of it. While it takes long, a terminal shows what
// is being `awaited`: "the server's answer". A job that does not come to its end gives a failure
// with a reason of its own.
Result RunJob(const WorkerLimits& limits, const std::string& awaited,
              const std::function<Result()>& job);

// The failure of a worker that did not come to its end, or was not allowed to.
Result FailureOf(const WorkerEnd& end, const WorkerLimits& limits);

}  // namespace quendelctl

#endif  // QUENDELCTL_JOB_H_
