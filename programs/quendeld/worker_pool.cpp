#include "worker_pool.h"

#include <sstream>
#include <utility>

#include "json.h"
#include "worker.h"

namespace quendeld {
namespace {

std::string InSeconds(Duration time) {
  std::ostringstream text;
  text << std::chrono::duration<double>(time).count();
  return text.str();
}

}  // namespace

bool WorkerEnd::Succeeded() const {
  return answered && NumberOf(answer, "result") == 0;
}

WorkerPool::WorkerPool(Loop& loop, const Settings& settings, std::string program, bool foreground)
    : loop_(loop), settings_(settings), program_(std::move(program)), foreground_(foreground) {
}

WorkerPool::~WorkerPool() = default;

void WorkerPool::Submit(Lane lane, Job job) {
  if (ended_) {
    return;  // the daemon ends; what is not begun is begun after the next start
  }
  State(lane).waiting.push_back(std::move(job));
  if (!State(lane).worker) {
    StartNext(lane);
  }
}

bool WorkerPool::IsIdle(Lane lane) const {
  const LaneState& state = lanes_[static_cast<size_t>(lane)];
  return !state.worker && state.waiting.empty();
}

void WorkerPool::StartNext(Lane lane) {
  LaneState& state = State(lane);
  if (state.worker || state.waiting.empty()) {
    return;
  }
  const Job& job = state.waiting.front();
  Json::Value request = job.request.isObject() ? job.request : Json::Value(Json::objectValue);
  request["work"] = job.work;
  WorkerSetup setup;
  setup.program = program_;
  setup.name = "worker-" + std::to_string(++started_);
  setup.limit = InSeconds(job.limit);
  setup.foreground = foreground_;
  setup.time_limit = job.limit;
  setup.kill_after = settings_.kill_after;
  setup.memory_limit_mb = settings_.memory_limit_mb;
  state.worker = std::make_unique<Worker>(
      loop_, setup, JsonLine(request), [this, lane](const WorkerEnd& end) { Finish(lane, end); });
}

void WorkerPool::Finish(Lane lane, const WorkerEnd& end) {
  LaneState& state = State(lane);
  const std::unique_ptr<Worker> gone = std::move(state.worker);
  if (!state.waiting.empty()) {
    const Job job = std::move(state.waiting.front());
    state.waiting.pop_front();
    if (!ended_ && job.done) {
      job.done(end);
    }
  }
  if (ended_) {
    for (const LaneState& other : lanes_) {
      if (other.worker) {
        return;
      }
    }
    const std::function<void()> ended = std::exchange(ended_, nullptr);
    ended();
    return;
  }
  StartNext(lane);
}

void WorkerPool::Interrupt(Lane lane, const std::string& reason) {
  LaneState& state = State(lane);
  std::deque<Job> waiting;
  waiting.swap(state.waiting);
  if (state.worker) {
    state.waiting.push_back(std::move(waiting.front()));  // it is the one that is worked on
    waiting.pop_front();
    state.worker->End(reason);
  }
  WorkerEnd end;
  end.reason = reason;
  for (const Job& job : waiting) {
    if (job.done) {
      job.done(end);
    }
  }
}

void WorkerPool::EndAll(std::function<void()> ended) {
  bool any = false;
  for (LaneState& state : lanes_) {
    state.waiting.clear();
    if (state.worker) {
      any = true;
      state.worker->End("the daemon ends");
    }
  }
  if (any) {
    ended_ = std::move(ended);
  } else {
    loop_.Soon(std::move(ended));
  }
}

}  // namespace quendeld
