// The web API, of which this platform has what remote support needs.
#include "platform/api_runner.h"

#include <string_view>

#include "platform/standalone/ssh_service.h"

namespace platform {
namespace {

constexpr int kBadParameters = 400;
constexpr int kForbidden = 403;
constexpr int kUnknown = 404;
constexpr int kFailed = 500;

// The one user who may call what changes the device.
constexpr std::string_view kAdministrator = "admin";

// One method. Its function returns 0 when it succeeded, else the failure's code.
struct Method {
  std::string_view api;
  int version;
  std::string_view name;
  int (*run)(const Json::Value& params);
};

int SetTerminal(const Json::Value& params) {
  if (!params.isObject() || params.size() != 1 || !params["enable_ssh"].isBool()) {
    return kBadParameters;
  }
  const bool isDone = params["enable_ssh"].asBool() ? StartSshService() : StopSshService();
  return isDone ? 0 : kFailed;
}

constexpr Method kMethods[] = {
    {"ARVO.Core.Terminal", 3, "set", SetTerminal},
};

std::string_view TextOf(const char* text) {
  return text == nullptr ? std::string_view() : text;
}

int Call(std::string_view api, int version, std::string_view name, const Json::Value& params,
         std::string_view user) {
  for (const Method& method : kMethods) {
    if (method.api == api && method.version == version && method.name == name) {
      return user == kAdministrator ? method.run(params) : kForbidden;
    }
  }
  return kUnknown;
}

Json::Value ReplyFor(int code) {
  Json::Value reply(Json::objectValue);
  reply["success"] = code == 0;
  if (code != 0) {
    reply["error"]["code"] = code;
  }
  return reply;
}

}  // namespace
}  // namespace platform

void ARVO::APIRunner::Exec(Json::Value& out, const char* api, int version, const char* method,
                           const Json::Value& params, const char* user) try {
  using platform::TextOf;
  out = platform::ReplyFor(
      platform::Call(TextOf(api), version, TextOf(method), params, TextOf(user)));
} catch (...) {
  out = Json::Value();  // no memory for a reply; null has no "success" either
}
