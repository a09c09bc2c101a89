// The few settings that the library reads for itself: contact list, server host, service state.
#include "conf/server_host.h"

#include <json/value.h>

#include "base/json_text.h"
#include "base/log.h"
#include "base/paths.h"
#include "conf/hash_value.h"
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
  if (JsonFromText(text, contact)) {
    return contact;
  }
  return Json::arrayValue;
}

}  // namespace

const char* ServerHost() {
  // The byte behind the 32 that the platform may write keeps the text from running on.
  static char configured[32 + 1] = {};
  // Deliberate: looked up once in the life of the process, and a failed read is final too.
  static const bool isConfigured =
      ALIBCFileGetKeyValue(kDefaultsFile, "quendel_server", configured, 32, 0) > 0;
  return isConfigured ? configured : QUENDEL_DEFAULT_SERVER_HOST;
}

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
  conf->contact = ContactFromText(HashValue(hash.get(), "contact"));
  return 0;
} catch (...) {
  QUENDEL_LOG("Fail to allocate memory for alibc hash");
  return -1;
}

std::string QUENDELGetServerHost() try { return ServerHost(); } catch (...) {
  return {};
}

int QUENDELIsEnable() {
  return ALIBServiceIsEnabled("quendeld");
}

std::string QUENDELGetHashValue(ALIBSZHASH* hash, const char* key) try {
  return HashValue(hash, key);
} catch (...) {
  return {};
}
