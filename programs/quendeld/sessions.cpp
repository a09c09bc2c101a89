#include "sessions.h"

#include <syslog.h>

#include <algorithm>
#include <ctime>
#include <utility>

#include "backoff.h"
#include "json.h"

namespace quendeld {
namespace {

constexpr int kNoRequest = 0;
constexpr int kDone = 0;
constexpr Duration kFirstRetry = std::chrono::seconds(5);

}  // namespace

Duration TimeLeft(Duration limit, int64_t opened, int64_t now) {
  const Duration passed = std::chrono::seconds(std::max<int64_t>(0, now - opened));
  return std::max(Duration::zero(), limit - std::min(passed, limit));
}

Sessions::Sessions(const Context& context, Service& service)
    : context_(context),
      service_(service),
      limit_(context.loop, [this] { CloseForItsLength(); }),
      retry_(context.loop, [this] { Attempt(); }) {
}

void Sessions::Update() {
  if (service_.session() == opened_) {
    return;
  }
  opened_ = service_.session();
  if (!opened_) {
    syslog(LOG_NOTICE, "the support session has ended");
    limit_.Stop();
    return;
  }
  const Duration left = TimeLeft(context_.settings.session_limit, *opened_, time(nullptr));
  syslog(LOG_NOTICE, "a support session is open; it is closed in %lld s at the latest",
         static_cast<long long>(std::chrono::duration_cast<std::chrono::seconds>(left).count()));
  limit_.Start(left);
}

void Sessions::CloseForItsLength() {
  if (!is_closing_for_length_) {
    is_closing_for_length_ = true;
    syslog(LOG_WARNING, "the support session has lasted as long as it may; it is closed");
    Close(kNoRequest, kDone, true,
          [this](Ending ending) { is_closing_for_length_ = ending == Ending::kStillOpen; });
  }
}

void Sessions::Close(int id, int progress, bool repeated, Done done) {
  closings_.push_back({id, progress, repeated, std::move(done)});
  Attempt();
}

void Sessions::Attempt() {
  if (is_trying_ || closings_.empty()) {
    return;
  }
  is_trying_ = true;
  retry_.Stop();
  const Closing& closing = closings_.front();
  Json::Value work = Json::objectValue;
  work["id"] = closing.id;
  work["progress"] = closing.progress;
  work["silent"] = !service_.MayTalk();
  context_.workers.Submit(Lane::kSession,
                          {"remote_close", work, context_.settings.conversation_limit,
                           [this](const WorkerEnd& end) { Ended(end); }});
}

void Sessions::Ended(const WorkerEnd& end) {
  is_trying_ = false;
  if (end.Succeeded()) {
    Finish(Ending::kEnded);
  } else if (BoolOf(end.answer, "no_session")) {
    Finish(closings_.front().repeated || failures_ > 0 ? Ending::kEnded : Ending::kNoSession);
  } else {
    if (++failures_ == 1) {
      closings_.front().done(Ending::kStillOpen);
    }
    syslog(LOG_ERR, "the support session is not closed yet%s%s", end.reason.empty() ? "" : ": ",
           end.reason.c_str());
    retry_.Start(NextAttempt(std::min(kFirstRetry, context_.settings.heartbeat_interval), 0,
                             context_.settings.heartbeat_interval, failures_, Chance()));
  }
}

void Sessions::Finish(Ending ending) {
  const Closing closing = std::move(closings_.front());
  closings_.pop_front();
  failures_ = 0;
  closing.done(ending);
  service_.Look();
  Attempt();
}

}  // namespace quendeld
