// A process of its own for whatever may hang, grow or end more than itself.
#ifndef QUENDELCTL_WORKER_H_
#define QUENDELCTL_WORKER_H_

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace quendelctl {

// What a worker, with all that it starts, may take.
struct WorkerLimits {
  std::chrono::seconds time;
  uint64_t memory_bytes;  // of data in each process; the address sanitizer needs more, and gets it
};

// How a worker ended.
struct WorkerEnd {
  std::optional<std::string> report;  // what the work returned, if the worker lived to tell
  int signal = 0;                     // the signal that ended the worker, or 0
  bool interrupted = false;           // by a signal that was meant for this program
  bool timed_out = false;
};

// Does the work in a child process that leads its own session and its own process group. A run of
// the collection reaps whatever child it has, and one that fails early ends its process group; a
// server may never answer, and a tool never end. Here none of it touches this program.
//
// Calls `look` with the worker's process id about fifty times a second while it works, and once
// more before it is ended. The worker is ended with all that is in its group when its time is over,
// and at SIGHUP, SIGINT, SIGQUIT and SIGTERM; then the function returns. What the worker has left
// in its group is ended as well. When this program dies, be it by SIGKILL, the group dies with it.
//
// Throws std::system_error when the system has no descriptor or process left. Call it before any
// thread was started. `work` must not throw.
WorkerEnd RunInWorker(const WorkerLimits& limits, const std::function<std::string()>& work,
                      const std::function<void(pid_t)>& look);

}  // namespace quendelctl

#endif  // QUENDELCTL_WORKER_H_
