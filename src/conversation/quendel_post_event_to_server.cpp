// The event report: something happened on the device that the server is to know.
#include <iterator>

#include "base/json_text.h"
#include "base/log.h"
#include "conf/identity.h"
#include "quendel/conf.h"
#include "quendel/conversation.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_post_event_to_server";

// Returns the event's name, or an empty text for a value that is no event.
std::string EventName(QuendelEvent_t event) {
  const auto index = static_cast<unsigned int>(event);
  return index < std::size(QUENDEL_ACTION_NAMES) ? QUENDEL_ACTION_NAMES[index] : "";
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELPostEventToServer(QuendelEvent_t event, Json::Value& reply,
                             const Json::Value& hmxInfo) try {
  const std::string name = EventName(event);
  // Deliberate: the record comes before the check of the event, and every event needs an account,
  // even one that says that nobody is signed in any more.
  AccountRecord account;
  if (!account) {
    QUENDEL_LOG("Failed to malloc for pMyhubAccount");
    return -1;
  }
  if (name.empty()) {
    QUENDEL_LOG("Bad event: [%d]", static_cast<int>(event));
    return -1;
  }
  std::string serialNumber;
  if (!ReadSerialNumber(serialNumber)) {
    QUENDEL_LOG("Failed to get serial number");
    return -1;
  }
  if (!account.Fill()) {
    QUENDEL_LOG("Failed to get account");
    return -1;
  }
  const std::string url =
      QUENDELGenerateReq({"action", account.field_a(), account.field_b(), serialNumber});

  Json::Value body(Json::objectValue);
  body["action"] = name;
  body["hmx_account_email"] = account.email();
  if (event == QUENDEL_EVENT_ENABLE) {
    body["hmx_info"] = hmxInfo;
  }
  QUENDELConf_t conf;
  if (QUENDELGetConf(&conf) < 0) {
    QUENDEL_LOG("Failed to get quendel config");
    return -1;
  }
  body["contact"] = conf.contact;

  if (QUENDELPostDataToServer(url.c_str(), body, reply) < 0) {
    QUENDEL_LOG("Failed to post quendel config");
    return -1;
  }
  if (!JsonBool(reply, "success")) {
    QUENDEL_LOG("Failed to post event, server return failed. [%s]", JsonToText(reply).c_str());
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to post quendel config");
  return -1;
}
