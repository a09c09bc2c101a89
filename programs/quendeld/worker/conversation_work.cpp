// The work that tells the server something and hears what it says.
#include <syslog.h>
#include <unistd.h>

#include "json.h"
#include "quendel.h"
#include "worker/device_facts.h"
#include "worker/work.h"

namespace quendel_worker {

Json::Value TellFacts(const Json::Value& /*request*/) {
  Json::Value answer = Json::objectValue;
  answer["facts"] = DeviceFacts();
  answer["result"] = 0;
  return answer;
}

Json::Value SendHeartbeat(const Json::Value& request) {
  const Json::Value facts = DeviceFacts();
  Json::Value answer = Disabled();
  if (quendeld::BoolOf(facts, "enabled")) {
    answer = Json::objectValue;
    Json::Value actions;
    answer["result"] = quendeld::BoolOf(request, "send") ? QUENDELHeartbeat(actions) : 0;
    answer["actions"] = actions;
  }
  answer["facts"] = facts;
  return answer;
}

Json::Value SendReports(const Json::Value& request) {
  if (QUENDELIsEnable() == 0) {
    return Disabled();
  }
  Json::Value answer = Json::objectValue;
  answer["accepted"] = Json::arrayValue;
  answer["result"] = 0;
  for (const Json::Value& report : quendeld::Member(request, "reports")) {
    const int id = static_cast<int>(quendeld::NumberOf(report, "id").value_or(0));
    const int progress = static_cast<int>(quendeld::NumberOf(report, "progress").value_or(-1));
    if (QUENDELUpdateActRequestProgress(id, static_cast<QuendelActionProgress_t>(progress),
                                        Json::objectValue) != 0) {
      answer["result"] = -1;
      break;
    }
    answer["accepted"].append(id);
  }
  return answer;
}

Json::Value SendEvent(const Json::Value& request) {
  const auto event = static_cast<QuendelEvent_t>(quendeld::NumberOf(request, "event").value_or(-1));
  if (event != QUENDEL_EVENT_DISABLE && QUENDELIsEnable() == 0) {
    return Disabled();
  }
  Json::Value reply;
  Json::Value answer = Json::objectValue;
  answer["result"] = QUENDELPostEventToServer(event, reply, quendeld::Member(request, "info"));
  answer["answered"] = !reply.isNull();
  return answer;
}

Json::Value TakeSample(const Json::Value& /*request*/) {
  if (QUENDELIsEnable() == 0) {
    return Disabled();
  }
  Json::Value reply;
  Json::Value answer = Json::objectValue;
  answer["result"] = QUENDELCollectPerf(reply);
  answer["sample"]["success"] = true;
  answer["sample"]["perf_data"] = reply;
  return answer;
}

}  // namespace quendel_worker
