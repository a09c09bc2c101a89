// The collections: when one runs, whether it is sent or kept, and what follows from how it ended.
#ifndef QUENDELD_COLLECTIONS_H_
#define QUENDELD_COLLECTIONS_H_

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "context.h"
#include "heartbeat.h"
#include "service.h"

namespace quendeld {

// What a run that is due does.
enum class RunKind {
  kSend,  // gathers and sends
  kKeep,  // gathers, for the outbox
  kWait   // does not start before the server is there
};

// With the server away nothing is gathered that cannot be delivered, unless it would be lost.
RunKind DecideRun(bool isServerThere, bool isAnyAtRisk);

// When the next regular run is due: the interval after the last one, now where that is longer ago
// or was never. A clock that went back makes that no more than the interval.
Duration DueIn(Duration interval, int64_t last, int64_t now);

class Collections {
 public:
  using Done = std::function<void(bool collected, const std::string& reason)>;

  Collections(const Context& context, const Service& service, const Heartbeat& heartbeat);

  // Called after each run, so that new logs are watched.
  void OnLogs(std::function<void(const Json::Value& logs)> callback) {
    logs_changed_ = std::move(callback);
  }

  void Start();

  // Runs one as soon as none is under way, whether or not the server is there. `done` hears what
  // came of the first one that begins after this call.
  void Request(const std::string& cause, Done done);

  // Runs one for a rotation, or the regular one, as DecideRun() says.
  void Want(const std::string& cause);

  // The server is there: what waited for it goes on.
  void ServerIsThere();
  // It is not: what cannot wait for it does not.
  void ServerIsAway() { StartNext(); }

  // Clears away what dead work left, once nothing is under way.
  void Tidy();

  // Looks at the logs and the outbox, and hands them on. `done` may be empty.
  void Look(std::function<void()> done);

  bool is_running() const { return is_running_; }
  Duration next_in() const { return timer_.Left(); }
  const Json::Value& logs() const { return logs_; }
  const Json::Value& outbox() const { return outbox_; }
  bool has_failed() const { return failures_ > 0; }

 private:
  struct Wish {
    std::string cause;
    Done done;
  };

  void StartNext();
  void Decide();
  void Run(bool send);
  Json::Value RequestFor(bool send);
  void Ended(bool send, int64_t started, int64_t last_sample, const WorkerEnd& end);
  void NoteStuck(const Json::Value& stuck);
  void Schedule();
  void SendOutbox();

  const Context context_;
  const Service& service_;
  const Heartbeat& heartbeat_;
  std::function<void(const Json::Value&)> logs_changed_;
  Timer timer_;
  std::vector<Wish> requested_;  // to be served by the next run
  std::vector<Wish> serving_;    // by the run that is under way
  std::string wanted_;           // the cause of a run that may wait for the server
  Json::Value logs_ = Json::arrayValue;
  Json::Value outbox_ = Json::objectValue;
  bool is_running_ = false;
  bool is_deciding_ = false;
  bool is_sending_outbox_ = false;
  int failures_ = 0;
};

}  // namespace quendeld

#endif  // QUENDELD_COLLECTIONS_H_
