// The events that the server is to hear of: in order, each until it was accepted.
#ifndef QUENDELD_EVENTS_H_
#define QUENDELD_EVENTS_H_

#include <functional>

#include "context.h"
#include "service.h"

namespace quendeld {

class Events {
 public:
  Events(const Context& context, const Service& service);

  // Sends what waits, as long as the server takes it.
  void Flush();

  // Queues an event and flushes.
  void Queue(int event);

  // Tries once to send an event that is not queued, within `limit`.
  void SendOnce(int event, Duration limit, std::function<void(bool sent)> done);

  // Tries once, within `limit`, to send the newest event of the queue, which then stays in it
  // unless it was sent.
  void SendLast(int event, Duration limit, std::function<void()> done);

 private:
  void Send(const StoredEvent& event);
  void Sent(const StoredEvent& event, const WorkerEnd& end);
  void Refused(const StoredEvent& event);
  void TryLater();

  const Context context_;
  const Service& service_;
  Timer retry_;
  bool is_sending_ = false;
  int failures_ = 0;
};

}  // namespace quendeld

#endif  // QUENDELD_EVENTS_H_
