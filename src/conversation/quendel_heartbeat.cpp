// The heartbeat: the device is alive, and the server may have actions for it.
#include "base/json_text.h"
#include "base/log.h"
#include "conf/identity.h"
#include "quendel/conversation.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_heartbeat";

// Json::Value::clear() accepts only arrays, objects and null.
void Clear(Json::Value& value) {
  if (value.isArray() || value.isObject()) {
    value.clear();
  } else {
    value = Json::Value();
  }
}

void TakeActions(const Json::Value& reply, Json::Value& actions) {
  const Json::Value* queued = JsonMember(reply, "actions");
  if (queued != nullptr) {
    actions = *queued;
  } else {
    Clear(actions);
  }
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELHeartbeat(Json::Value& actions) try {
  std::string serialNumber;
  if (!ReadSerialNumber(serialNumber)) {
    QUENDEL_LOG("Failed to get serial number");
    return -1;
  }
  const std::string url = QUENDELGenerateReq({"heartbeat", serialNumber});
  Json::Value reply;
  if (QUENDELPostDataToServer(url.c_str(), Json::Value(), reply) < 0) {
    // Deliberate: the text of the other conversations, although this is the heartbeat.
    QUENDEL_LOG("Failed to post quendel config");
    return -1;
  }
  if (!JsonBool(reply, "success")) {
    QUENDEL_LOG("Failed to send heartbeat, server return failed. [%s]", JsonToText(reply).c_str());
    return -1;
  }
  TakeActions(reply, actions);
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to post quendel config");
  return -1;
}
