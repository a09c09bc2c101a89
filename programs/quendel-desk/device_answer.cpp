// The answers that devices get.
#include "device_answer.h"

#include "access_log.h"
#include "json.h"

namespace quendeldesk {

Answer DeviceAnswer(const Verdict& verdict, const Json::Value& actions) {
  Json::Value reply;
  reply["success"] = verdict.code == kAccepted;
  if (verdict.code != kAccepted) {
    reply["code"] = verdict.code;
    reply["message"] = verdict.message;
  } else if (!actions.isNull()) {
    reply["actions"] = actions;
  }
  Answer answer;
  answer.body = JsonText(reply);
  answer.code = verdict.code;
  answer.note = verdict.message;
  return answer;
}

// The reason is for the desk's own log: it may name its files.
Verdict VerdictOf(const std::exception_ptr& failure) {
  try {
    std::rethrow_exception(failure);
  } catch (const std::exception& error) {
    LogLine(error.what());
  }
  return {kOtherFailure, "the request could not be stored"};
}

}  // namespace quendeldesk
