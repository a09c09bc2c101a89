#include "heartbeat.h"

#include <syslog.h>

#include <ctime>
#include <utility>

#include "backoff.h"
#include "json.h"

namespace quendeld {

Heartbeat::Heartbeat(const Context& context, Service& service,
                     std::function<void(const Json::Value&)> accepted, std::function<void()> failed)
    : context_(context),
      service_(service),
      accepted_(std::move(accepted)),
      failed_(std::move(failed)),
      timer_(context.loop, [this] { Beat(); }) {
}

void Heartbeat::Start() {
  timer_.Start(
      std::chrono::duration_cast<Duration>(context_.settings.first_heartbeat_within * Chance()));
}

void Heartbeat::Now(std::function<void(bool)> done) {
  if (done) {
    listeners_.push_back(std::move(done));
  }
  Beat();
}

// The worker looks at the switch in any case, so this also is how a change of it is seen.
void Heartbeat::Beat() {
  if (is_under_way_) {
    return;
  }
  is_under_way_ = true;
  timer_.Stop();
  Json::Value request = Json::objectValue;
  request["send"] = !service_.paused();
  context_.workers.Submit(Lane::kTalk, {"heartbeat", request, context_.settings.conversation_limit,
                                        [this](const WorkerEnd& end) { Ended(end); }});
}

void Heartbeat::Ended(const WorkerEnd& end) {
  is_under_way_ = false;
  service_.Learn(Member(end.answer, "facts"));
  const bool isSilent = BoolOf(end.answer, "disabled") || service_.paused();
  const bool accepted = end.Succeeded() && !isSilent;
  if (accepted) {
    if (failures_ > 0) {
      syslog(LOG_NOTICE, "the server accepts heartbeats again, after %d failures", failures_);
    }
    failures_ = 0;
    last_accepted_ = time(nullptr);
  } else if (!isSilent && ++failures_ == 1) {
    syslog(LOG_WARNING, "the server did not accept a heartbeat%s%s", end.reason.empty() ? "" : ": ",
           end.reason.c_str());
  }
  Schedule();
  for (const auto& listener : std::exchange(listeners_, {})) {
    listener(accepted);
  }
  if (accepted) {
    accepted_(Member(end.answer, "actions"));
  } else if (!isSilent) {
    failed_();
  }
}

void Heartbeat::Schedule() {
  const Settings& settings = context_.settings;
  timer_.Start(NextAttempt(settings.heartbeat_interval, settings.heartbeat_jitter,
                           settings.heartbeat_backoff_limit, failures_, Chance()));
}

}  // namespace quendeld
