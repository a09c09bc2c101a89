// Delivers the files that the server asked for, in one post.
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/log.h"
#include "conf/identity.h"
#include "quendel/transport.h"
#include "quendel/upload.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_send_upload_data";

// Describes one file to the server.
int QUENDELFillUploadFileInfo(Json::Value& info, const QUENDELSendDataParam_t& item) {
  char timestamp[64] = {};
  snprintf(timestamp, sizeof timestamp, "%llu", static_cast<unsigned long long>(item.timestamp));
  info["filename"] = basename(item.path.c_str());
  info["type"] = item.type;
  info["fileuuid"] = item.fileuuid;
  info["timestamp"] = timestamp;
  return 0;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELSendUploadData(int actionId, const std::vector<QUENDELSendDataParam_t>& files) try {
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
  char action[8] = {};
  snprintf(action, sizeof action, "%d", actionId);
  const std::string url = QUENDELGenerateReq(
      {"upload_file", action, account.field_a(), account.field_b(), serialNumber});
  if (QUENDELPostFileToServer(url.c_str(), "upload_list", files, QUENDELFillUploadFileInfo) < 0) {
    QUENDEL_LOG("Failed to post file to server");
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to post file to server");
  return -1;
}
