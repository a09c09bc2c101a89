// The performance service, answered inside this process.
#include "platform/transmitor.h"

#include "platform/standalone/error_code.h"
#include "platform/standalone/performance_figures.h"

namespace {

// The request {"request": "curr"} and no other.
bool AsksForCurrentFigures(const Json::Value& request) {
  return request.isObject() && request.size() == 1 && request["request"] == Json::Value("curr");
}

}  // namespace

Transmitor::Transmitor(const std::string& host) : host_(host) {
}

int Transmitor::Transmit(const Json::Value& request) try {
  reply_ = Json::Value();
  if (host_ != "localhost" || !AsksForCurrentFigures(request)) {
    return platform::FailForArgument();
  }
  Json::Value reply(Json::objectValue);
  reply["success"] = true;
  reply["data"] = platform::CurrentFigures();
  reply_.swap(reply);
  return 0;
} catch (...) {
  return platform::FailForException();
}

int Transmitor::GetDataJson(Json::Value& reply) try {
  if (reply_.isNull()) {
    return platform::Fail(platform::kErrorNoAnswer);
  }
  reply.swap(reply_);
  reply_ = Json::Value();
  return 0;
} catch (...) {
  return platform::FailForException();
}
