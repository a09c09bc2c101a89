// The signed-in account, as the device's own file tells it.
#include "platform/account.h"

#include <string>

#include "platform/standalone/copy_text.h"
#include "platform/standalone/device_conf.h"
#include "platform/standalone/error_code.h"

namespace platform {
namespace {

// The texts of the record: where each begins, and where the room for it ends.
constexpr struct {
  const char* key;
  size_t begin;
  size_t end;
} kTexts[] = {
    {"account_email", kAccountEmailOffset, kAccountFieldAOffset},
    {"account_field_a", kAccountFieldAOffset, kAccountFieldBOffset},
    {"account_field_b", kAccountFieldBOffset, kAccountRecordBytes},
};

}  // namespace
}  // namespace platform

int ARVOMYHUBAccountGet(void* record) try {
  if (record == nullptr) {
    return platform::FailForArgument();
  }
  platform::DeviceConf conf;
  if (!conf.Read()) {
    return -1;
  }
  if (conf.Value("account_email").empty()) {
    return platform::Fail(platform::kErrorNoAccount);
  }
  for (const auto& text : platform::kTexts) {
    char* const begin = static_cast<char*>(record) + text.begin;
    platform::CopyText(conf.Value(text.key), begin, text.end - text.begin);
  }
  return 0;
} catch (...) {
  return platform::FailForException();
}
