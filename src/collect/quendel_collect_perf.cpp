// Asks the local performance service for the device's current figures.
#include "base/json_text.h"
#include "base/log.h"
#include "platform/transmitor.h"
#include "quendel/collect.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_collect_perf";

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELCollectPerf(Json::Value& reply) try {
  Transmitor service("localhost");
  Json::Value request;
  request["request"] = "curr";
  if (service.Transmit(request) < 0) {
    QUENDEL_LOG("Failed to send perf request");
    return -1;
  }
  if (service.GetDataJson(reply) < 0) {
    QUENDEL_LOG("Failed to get perf json reply");
    return -1;
  }
  if (!JsonBool(reply, "success") || JsonMember(reply, "data") == nullptr) {
    QUENDEL_LOG("Failed to get perf data");
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to get perf data");
  return -1;
}
