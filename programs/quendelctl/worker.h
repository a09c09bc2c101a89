// A process of its own for a collection run.
#ifndef QUENDELCTL_WORKER_H_
#define QUENDELCTL_WORKER_H_

#include <sys/types.h>

#include <functional>
#include <optional>

namespace quendelctl {

// How a worker ended.
struct WorkerEnd {
  std::optional<int> result;  // what the work returned, if the worker lived to tell
  int signal = 0;             // the signal that ended the worker, or 0
  bool interrupted = false;   // by a signal that was meant for this program
};

// Does the work in a child process that leads its own session and its own process group. A run of
// the collection reaps whatever child it has, and one that fails early ends its process group; here
// neither touches this program.
//
// Calls `look` with the worker's process id about fifty times a second while it works, and once
// more before it is ended. SIGHUP, SIGINT, SIGQUIT and SIGTERM end the worker with all that is in
// its group, and then the function returns. The group is ended as well when the worker died without
// a result.
//
// Throws std::system_error when the system has no pipe or process left. Call it before any thread
// was started.
WorkerEnd RunInWorker(const std::function<int()>& work, const std::function<void(pid_t)>& look);

}  // namespace quendelctl

#endif  // QUENDELCTL_WORKER_H_
