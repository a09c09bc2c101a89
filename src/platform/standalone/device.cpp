// The device's serial number and its services.
#include "platform/device.h"

#include <string>

#include "platform/standalone/copy_text.h"
#include "platform/standalone/device_conf.h"
#include "platform/standalone/error_code.h"

int ALIBGetSerialNumber(char* buf, int size) try {
  if (buf == nullptr || size < 1) {
    return platform::FailForArgument();
  }
  platform::DeviceConf conf;
  if (!conf.Read()) {
    return -1;
  }
  const std::string serialNumber = conf.Value("serial_number");
  if (serialNumber.empty()) {
    return platform::Fail(platform::kErrorKeyNotFound);
  }
  platform::CopyText(serialNumber, buf, static_cast<size_t>(size));
  return 0;
} catch (...) {
  return platform::FailForException();
}

int ALIBServiceIsEnabled(const char* name) try {
  if (name == nullptr) {
    platform::FailForArgument();
    return 0;
  }
  platform::DeviceConf conf;
  return conf.Read() && conf.Value(std::string("service_") + name) == "yes" ? 1 : 0;
} catch (...) {
  platform::FailForException();
  return 0;
}
