// The workers: each piece of work that could block is done by a process of its own, quendel-worker,
// which gets a request and gives an answer, a line of JSON each.
//
// A worker leads a session. It has a time limit, after which its session gets SIGTERM and then
// SIGKILL, and a memory limit. However it ended, nothing of its session is left when the next one
// of its lane starts.
#ifndef QUENDELD_WORKER_POOL_H_
#define QUENDELD_WORKER_POOL_H_

#include <json/value.h>

#include <array>
#include <deque>
#include <functional>
#include <memory>
#include <string>

#include "loop.h"
#include "settings.h"

namespace quendeld {

// What came of a piece of work.
struct WorkerEnd {
  bool answered = false;
  Json::Value answer;
  std::string reason;  // when it did not answer

  // Whether the answer's "result" is 0, which is success throughout.
  bool Succeeded() const;
};

struct Job {
  std::string work;     // the request's member "work"
  Json::Value request;  // its other members
  Duration limit;
  std::function<void(const WorkerEnd&)> done;
};

// One job of a lane at a time, in order; the lanes do not wait for each other.
enum class Lane {
  kTalk,     // short exchanges with the server
  kWork,     // what takes long: collections, uploads
  kSession,  // the end of a support session, which must not wait for those
  kLocal     // what asks the device only
};

class Worker;

class WorkerPool {
 public:
  // `program` is quendel-worker's path. `foreground` has the workers log to the standard error
  // output.
  WorkerPool(Loop& loop, const Settings& settings, std::string program, bool foreground);
  ~WorkerPool();
  WorkerPool(const WorkerPool&) = delete;
  WorkerPool& operator=(const WorkerPool&) = delete;

  void Submit(Lane lane, Job job);

  // Whether the lane has nothing to do.
  bool IsIdle(Lane lane) const;

  // Ends what the lane is doing, and what it was to do is not begun; all end for this reason.
  void Interrupt(Lane lane, const std::string& reason);

  // Forgets what waits, ends what runs, and calls back when nothing is left. Their ends are not
  // reported.
  void EndAll(std::function<void()> ended);

 private:
  struct LaneState {
    std::deque<Job> waiting;
    std::unique_ptr<Worker> worker;
  };

  LaneState& State(Lane lane) { return lanes_[static_cast<size_t>(lane)]; }
  void StartNext(Lane lane);
  void Finish(Lane lane, const WorkerEnd& end);

  Loop& loop_;
  const Settings& settings_;
  const std::string program_;
  const bool foreground_;
  std::array<LaneState, 4> lanes_;
  std::function<void()> ended_;
  int64_t started_ = 0;
};

}  // namespace quendeld

#endif  // QUENDELD_WORKER_POOL_H_
