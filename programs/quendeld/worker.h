// One worker process, from its start until nothing of its session is left.
#ifndef QUENDELD_WORKER_H_
#define QUENDELD_WORKER_H_

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>

#include "loop.h"
#include "session.h"
#include "worker_pool.h"

namespace quendeld {

// How long an answer, and a request, can be: what a pipe holds, so that neither side ever waits for
// the other.
inline constexpr int kPipeBytes = 1 << 20;

struct WorkerSetup {
  std::string program;
  std::string name;   // of its control group
  std::string limit;  // for the reason that it ran out of time
  bool foreground = false;
  Duration time_limit{};
  Duration kill_after{};
  int64_t memory_limit_mb = 0;
};

class Worker {
 public:
  // Starts the process. `ended` is called once, from the loop, when nothing of it is left.
  Worker(Loop& loop, const WorkerSetup& setup, const std::string& request,
         std::function<void(const WorkerEnd&)> ended);
  ~Worker();
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  // Ends it before its time.
  void End(const std::string& reason);

 private:
  void Start(const std::string& request);
  void HandOver(const std::string& request);
  void LimitMemory() const;
  void Escalate();
  void LeaderEnded();
  void EndFollowers();
  void Report();
  std::string ReadAnswer() const;

  Loop& loop_;
  const WorkerSetup setup_;
  const std::function<void(const WorkerEnd&)> ended_;
  const ControlGroup group_;
  WorkerEnd end_;
  pid_t process_ = -1;
  int process_descriptor_ = -1;
  int request_pipe_ = -1;
  int answer_pipe_ = -1;
  int looks_ = 0;
  bool is_killed_ = false;
  Timer timer_;
  std::unique_ptr<Readable> exit_;
};

}  // namespace quendeld

#endif  // QUENDELD_WORKER_H_
