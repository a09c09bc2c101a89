#include "events.h"

#include <syslog.h>

#include "backoff.h"
#include "json.h"

namespace quendeld {
namespace {

// An event that the server goes on refusing is tried after the others, and not for ever.
constexpr int64_t kMostRefusals = 100;

Json::Value RequestFor(int event, const Json::Value& info) {
  Json::Value request = Json::objectValue;
  request["event"] = event;
  request["info"] = info;
  return request;
}

}  // namespace

Events::Events(const Context& context, const Service& service)
    : context_(context), service_(service), retry_(context.loop, [this] { Flush(); }) {
}

void Events::Flush() {
  if (is_sending_) {
    return;
  }
  // A service that is off tells of that, and of nothing else.
  const std::optional<int> only = service_.MayTalk() ? std::nullopt : std::optional(kEventDisable);
  const std::optional<StoredEvent> next = context_.journal.NextEvent(only);
  if (next && service_.enabled().has_value()) {
    Send(*next);
  }
}

void Events::Queue(int event) {
  if (!context_.journal.QueueEvent(event, Json::nullValue, context_.settings.events_kept,
                                   "last_event", std::to_string(event))) {
    syslog(LOG_ERR, "the queue of events is full; the oldest one is dropped");
  }
  Flush();
}

void Events::Send(const StoredEvent& event) {
  is_sending_ = true;
  context_.workers.Submit(Lane::kTalk, {"event", RequestFor(event.event, event.info),
                                        context_.settings.conversation_limit,
                                        [this, event](const WorkerEnd& end) { Sent(event, end); }});
}

void Events::Sent(const StoredEvent& event, const WorkerEnd& end) {
  is_sending_ = false;
  if (end.Succeeded()) {
    context_.journal.EventAccepted(event.sequence);
    failures_ = 0;
    retry_.Stop();
    Flush();
  } else if (BoolOf(end.answer, "answered")) {
    Refused(event);
  } else if (!service_.MayTalk() && event.event != kEventDisable) {
    Flush();  // the only one that may be sent now
  } else {
    TryLater();
  }
}

void Events::Refused(const StoredEvent& event) {
  const int64_t refusals = context_.journal.EventRefused(event.sequence);
  if (refusals >= kMostRefusals) {
    syslog(LOG_ERR, "the server refused event %d for the %lldth time; it is given up", event.event,
           static_cast<long long>(refusals));
    context_.journal.EventAccepted(event.sequence);
  }
  // Those behind it go first; what was refused as often waits for another day.
  const std::optional<StoredEvent> next = context_.journal.NextEvent(std::nullopt);
  if (next && next->refusals < refusals) {
    Flush();
  } else {
    TryLater();
  }
}

void Events::TryLater() {
  ++failures_;
  const Settings& settings = context_.settings;
  retry_.Start(NextAttempt(settings.heartbeat_interval, settings.heartbeat_jitter,
                           settings.heartbeat_backoff_limit, failures_, Chance()));
}

void Events::SendOnce(int event, Duration limit, std::function<void(bool sent)> done) {
  context_.workers.Submit(
      Lane::kSession, {"event", RequestFor(event, Json::nullValue), limit,
                       [done = std::move(done)](const WorkerEnd& end) { done(end.Succeeded()); }});
}

void Events::SendLast(int event, Duration limit, std::function<void()> done) {
  is_sending_ = true;  // for good: the daemon ends
  const std::optional<StoredEvent> last = context_.journal.NextEvent(event);
  SendOnce(event, limit, [this, last, done = std::move(done)](bool sent) {
    if (sent && last) {
      context_.journal.EventAccepted(last->sequence);
    }
    done();
  });
}

}  // namespace quendeld
