// The processes of a worker: all that share its session, and all in its control group.
#ifndef QUENDELD_SESSION_H_
#define QUENDELD_SESSION_H_

#include <sys/types.h>

#include <string>
#include <vector>

namespace quendeld {

// In the environment of each worker, and so of whatever it starts.
inline constexpr char kWorkerMark[] = "QUENDEL_WORKER=1";

// Returns the processes of the session but for its leader, whose id it is. Call this while the
// leader runs or is not reaped: its id is nobody else's then.
std::vector<pid_t> Followers(pid_t session);

// Signals the leader and the followers; what is stopped goes on, so that it can end.
void SignalSession(pid_t session, int number);

// Ends, by SIGKILL, every process that bears the mark of a worker: those of a daemon that was
// killed. Waits up to a second until they are gone.
void EndMarkedProcesses();

// A control group for one worker, below this process's own, where the system gives us one to
// divide. Otherwise it does nothing.
class ControlGroup {
 public:
  explicit ControlGroup(const std::string& name);
  ~ControlGroup();
  ControlGroup(const ControlGroup&) = delete;
  ControlGroup& operator=(const ControlGroup&) = delete;

  void Add(pid_t process) const;
  void Kill() const;
  bool IsEmpty() const;

 private:
  std::string folder_;  // empty when there is none
};

}  // namespace quendeld

#endif  // QUENDELD_SESSION_H_
