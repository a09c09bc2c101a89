// Who this device is, as the stand-alone platform's own file tells it.
#ifndef PLATFORM_STANDALONE_DEVICE_CONF_H_
#define PLATFORM_STANDALONE_DEVICE_CONF_H_

#include <string>

namespace platform {

// The text of quendel::kDeviceConfFile, read once for several keys. It is a flat key-value file
// with the keys serial_number, account_email, account_field_a, account_field_b, file_identity
// (inode or birth), timezone (a name
// such as Europe/Berlin), and service_<name> (yes or no) for each service.
class DeviceConf {
 public:
  // Returns false with the last error set when the file cannot be read.
  bool Read();

  // Returns a key's value, empty when the file lacks the key; the last error then says so.
  std::string Value(const std::string& key) const;

 private:
  std::string text_;
};

}  // namespace platform

#endif  // PLATFORM_STANDALONE_DEVICE_CONF_H_
