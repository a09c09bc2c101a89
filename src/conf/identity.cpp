// Who the device is to the server: its serial number and its owner's cloud account.
#include "conf/identity.h"

#include <cstring>

#include "platform/account.h"
#include "platform/device.h"

namespace quendel {

bool ReadSerialNumber(std::string& serialNumber) {
  char text[36] = {};
  if (ALIBGetSerialNumber(text, sizeof text) < 0) {
    return false;
  }
  serialNumber.assign(text, strnlen(text, sizeof text));
  return true;
}

AccountRecord::AccountRecord()
    : record_(static_cast<char*>(calloc(1, platform::kAccountRecordBytes))) {
}

bool AccountRecord::Fill() {
  return ARVOMYHUBAccountGet(record_.get()) >= 0;
}

std::string AccountRecord::email() const {
  return TextAt(platform::kAccountEmailOffset);
}

std::string AccountRecord::field_a() const {
  return TextAt(platform::kAccountFieldAOffset);
}

std::string AccountRecord::field_b() const {
  return TextAt(platform::kAccountFieldBOffset);
}

std::string AccountRecord::TextAt(size_t offset) const {
  const char* text = record_.get() + offset;
  return {text, strnlen(text, platform::kAccountRecordBytes - offset)};
}

}  // namespace quendel
