// The texts of an exchange: the URL of a request, the bytes of a reply, and what a reply says.
#include "base/json_text.h"
#include "base/log.h"
#include "conf/server_host.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "request_util";

// The server's own code for an unspecified failure; a reply without a usable answer counts as one.
constexpr int kNoUsableAnswer = 119999;

}  // namespace
}  // namespace quendel

using namespace quendel;

// NOLINTNEXTLINE(cert-err58-cpp): filled at load; where three entries find no room, nothing does.
const std::map<int, _tag_WEBAPI_CORE_ERR> QUENDELWebapiErrorMap = {
    {111000, WEBAPI_CORE_ERR_QUENDEL_DENIED},
    {111001, WEBAPI_CORE_ERR_QUENDEL_REJECTED},
    {kNoUsableAnswer, WEBAPI_CORE_ERR_QUENDEL_SERVER_FAILURE},
};

std::string QUENDELGenerateReq(const std::vector<std::string>& pieces) try {
  std::string url = std::string("https://") + ServerHost();
  for (const std::string& piece : pieces) {
    url += '/';
    url += piece;
  }
  return url;
} catch (...) {
  return {};
}

size_t QUENDELGetResponse(char* data, size_t size, size_t count, void* sink) try {
  static_cast<std::string*>(sink)->append(data, size * count);
  return size * count;
} catch (...) {
  return 0;  // libcurl's C frames let no exception through
}

int QUENDELParseResponse(const std::string& text) try {
  Json::Value reply;
  if (!JsonFromText(text, reply)) {
    QUENDEL_LOG("Failed to parse response");
    return kNoUsableAnswer;
  }
  if (JsonBool(reply, "success")) {
    return 0;
  }
  QUENDEL_LOG("Response is not success");
  const int code = JsonInt(reply, "code");
  return code != 0 ? code : kNoUsableAnswer;
} catch (...) {
  QUENDEL_LOG("Failed to parse response");
  return kNoUsableAnswer;
}

int QUENDELGetWebapiError(int code) {
  const auto found = QUENDELWebapiErrorMap.find(code);
  return found != QUENDELWebapiErrorMap.end() ? found->second : WEBAPI_CORE_ERR_QUENDEL_UNKNOWN;
}
