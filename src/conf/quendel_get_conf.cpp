// The few settings that the library reads for itself: contact list, server host, service state.
#include <json/value.h>

#include <cstring>
#include <mutex>

#include "base/json_text.h"
#include "base/log.h"
#include "base/paths.h"
#include "platform/device.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "quendel/conf.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_get_conf";

constexpr int kConfHashSize = 1024;

// A text that is missing, empty or not JSON stands for "no contacts".
Json::Value ContactFromText(const std::string& text) {
  Json::Value contact;
  if (!text.empty() && JsonFromText(text, contact)) {
    return contact;
  }
  return Json::arrayValue;
}

// The value of "quendel_server", or an empty text when the device does not name a server.
std::string ReadConfiguredHost() {
  char host[32] = {};
  if (ALIBCFileGetKeyValue(kDefaultsFile, "quendel_server", host, sizeof host, 0) <= 0) {
    return {};
  }
  return {host, strnlen(host, sizeof host)};
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetConf(QUENDELConf_t* conf) try {
  platform::OwnedHash hash(kConfHashSize);
  if (!hash) {
    QUENDEL_LOG("Fail to allocate memory for alibc hash");
    return -1;
  }
  if (ALIBCFileExist(kServiceConfFile) && ALIBCFileGetPair(kServiceConfFile, hash.slot()) < 0) {
    QUENDEL_LOG("Failed to get quendel configuration file");
    return -1;
  }
  conf->contact = ContactFromText(QUENDELGetHashValue(hash.get(), "contact"));
  return 0;
} catch (...) {
  QUENDEL_LOG("Fail to allocate memory for alibc hash");
  return -1;
}

std::string QUENDELGetServerHost() try {
  static std::mutex guard;
  static std::string host = QUENDEL_DEFAULT_SERVER_HOST;
  static bool lookedUp = false;

  const std::lock_guard<std::mutex> lock(guard);
  if (!lookedUp) {
    // Deliberate: set before the read, so that a failed read is final too and the file is consulted
    // once in the life of the process.
    lookedUp = true;
    std::string configured = ReadConfiguredHost();
    if (!configured.empty()) {
      host = std::move(configured);
    }
  }
  return host;
} catch (...) {
  return {};
}

int QUENDELIsEnable() {
  return ALIBServiceIsEnabled("quendeld");
}

std::string QUENDELGetHashValue(ALIBSZHASH* hash, const char* key) try {
  const char* value = ALIBCSzHashGetValue(hash, key);
  return value == nullptr ? std::string() : std::string(value);
} catch (...) {
  return {};
}
