// Who this device is, as the stand-alone platform's own file tells it.
#include "platform/standalone/device_conf.h"

#include "base/paths.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"
#include "platform/standalone/key_value_text.h"

namespace platform {

bool DeviceConf::Read() {
  return ReadWholeFile(quendel::kDeviceConfFile, text_);
}

std::string DeviceConf::Value(const std::string& key) const {
  WrittenPair pair;
  if (!FindPair(text_, key, pair)) {
    Fail(kErrorKeyNotFound);
    return std::string();
  }
  return DecodeValue(pair.value);
}

}  // namespace platform
