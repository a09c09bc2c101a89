// Posts the archive of a collection run to the server, with its description.
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>

#include "base/log.h"
#include "conf/identity.h"
#include "platform/zone.h"
#include "quendel/collect.h"
#include "quendel/conf.h"
#include "quendel/transport.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_send_collect_data";

// Describes the archive to the server. The post calls this for its only item.
int QUENDELFillCollectFileInfo(Json::Value& info, const QUENDELSendDataParam_t& item) {
  char localTime[32] = {};
  QUENDELGetLocalTime(localTime, sizeof localTime, static_cast<time_t>(item.timestamp));
  char zone[256] = {};
  int index = 0;
  if (ARVOZoneGet(zone, sizeof zone, &index) < 0) {
    QUENDEL_LOG("Failed to get timezone");
    return -1;
  }
  char description[256] = {};
  if (ARVOZoneDesc(zone, description, sizeof description) < 0) {
    QUENDEL_LOG("Failed to get timezone description");
    return -1;
  }
  char version[64] = {};
  if (QUENDELGetHMXVersion(version, sizeof version) < 0) {
    QUENDEL_LOG("Failed to get HMX version");
    return -1;
  }
  char timestamp[64] = {};
  snprintf(timestamp, sizeof timestamp, "%" PRIu64, item.timestamp);

  info["filename"] = basename(item.path.c_str());  // GNU's, which leaves its argument alone
  info["timestamp"] = timestamp;
  info["timezone"] = description;
  info["local_time"] = localTime;
  info["version"] = version;
  return 0;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELSendCollectData(const char* archive, long timestamp) try {
  QUENDELSendDataParam_t item;
  item.timestamp = static_cast<uint64_t>(timestamp);
  item.path = archive;

  AccountRecord account;
  if (!account) {
    QUENDEL_LOG("Failed to malloc for pMyhubAccount");
    return -1;
  }
  if (!account.Fill()) {
    QUENDEL_LOG("Failed to get account");
    return -1;
  }
  std::string serialNumber;
  if (!ReadSerialNumber(serialNumber)) {
    QUENDEL_LOG("Failed to get serial number");
    return -1;
  }
  const std::string url =
      QUENDELGenerateReq({"collect", account.field_a(), account.field_b(), serialNumber});
  if (QUENDELPostFileToServer(url.c_str(), "file", item, QUENDELFillCollectFileInfo) < 0) {
    QUENDEL_LOG("Failed to post file to server");
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to post file to server");
  return -1;
}
