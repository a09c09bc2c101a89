#include "service.h"

#include <syslog.h>

#include "json.h"

namespace quendeld {
namespace {

constexpr char kSwitchFact[] = "enabled";
constexpr char kPauseFact[] = "paused";
constexpr char kInfoFact[] = "info";

}  // namespace

Service::Service(const Context& context)
    : context_(context), paused_(context.journal.Fact(kPauseFact) == "yes") {
}

void Service::Learn(const Json::Value& facts) {
  if (!facts.isObject()) {
    return;
  }
  const bool enabled = BoolOf(facts, "enabled");
  host_ = TextOf(facts, "host");
  session_ = NumberOf(facts, "session");
  enabled_ = enabled;
  LearnInfo(facts);
  LearnSwitch(enabled, Member(facts, "info"));
  if (changed_) {
    changed_();
  }
}

void Service::LearnSwitch(bool enabled, const Json::Value& info) {
  const std::string before = context_.journal.Fact(kSwitchFact);
  if (enabled && before != "yes") {
    syslog(LOG_NOTICE, "the service is enabled");
    Queue(kEventEnable, info, kSwitchFact, "yes");
  } else if (!enabled && before == "yes") {
    syslog(LOG_NOTICE, "the service is disabled: nothing more is sent");
    Queue(kEventDisable, Json::nullValue, kSwitchFact, "no");
  }
}

// What the server was told when the service was enabled, and the contacts, which each event
// carries.
void Service::LearnInfo(const Json::Value& facts) {
  Json::Value known = Json::objectValue;
  known["info"] = Member(facts, "info");
  known["contact"] = Member(facts, "contact");
  const std::string text = JsonLine(known);
  const std::string before = context_.journal.Fact(kInfoFact);
  if (text == before) {
    return;
  }
  const bool serverKnowsOlder =
      !before.empty() && enabled_ == true && context_.journal.Fact(kSwitchFact) == "yes";
  if (serverKnowsOlder && !context_.journal.IsLastWaitingEvent(kEventUpdateInfo)) {
    Queue(kEventUpdateInfo, Json::nullValue, kInfoFact, text);
  } else {
    context_.journal.SetFact(kInfoFact, text);
  }
}

void Service::Queue(int event, const Json::Value& info, const std::string& key,
                    const std::string& value) {
  if (!context_.journal.QueueEvent(event, info, context_.settings.events_kept, key, value)) {
    syslog(LOG_ERR, "the queue of events is full; the oldest one is dropped");
  }
}

void Service::Look() {
  context_.workers.Submit(Lane::kLocal,
                          {"facts", Json::objectValue, context_.settings.local_limit,
                           [this](const WorkerEnd& end) { Learn(Member(end.answer, "facts")); }});
}

void Service::Pause(bool paused) {
  context_.journal.SetFact(kPauseFact, paused ? "yes" : "no");
  paused_ = paused;
  if (changed_) {
    changed_();
  }
}

}  // namespace quendeld
