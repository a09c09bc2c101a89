// The progress report: how an action that the server requested stands.
#include "base/json_text.h"
#include "base/log.h"
#include "conf/identity.h"
#include "quendel/conversation.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_update_act_request_progress";

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELUpdateActRequestProgress(
    int requestId, QuendelActionProgress_t progress,
    // NOLINTNEXTLINE(performance-unnecessary-value-param): as declared.
    Json::Value details) try {
  AccountRecord account;
  if (!account) {
    QUENDEL_LOG("Failed to malloc for pMyhubAccount");
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
  const std::string url = QUENDELGenerateReq({"action_progress", std::to_string(requestId),
                                              std::to_string(static_cast<int>(progress)),
                                              account.field_a(), account.field_b(), serialNumber});
  Json::Value reply;
  if (QUENDELPostDataToServer(url.c_str(), details, reply) < 0) {
    QUENDEL_LOG("Failed to post quendel config");
    return -1;
  }
  if (!JsonBool(reply, "success")) {
    QUENDEL_LOG("Failed to update action request, server return failed. [%s]",
                JsonToText(reply).c_str());
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to post quendel config");
  return -1;
}
