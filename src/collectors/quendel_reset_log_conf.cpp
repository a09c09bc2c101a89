// Forgets what was sent of one log.
#include "base/log.h"
#include "collectors/reset_value.h"
#include "platform/error.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "quendel/collectors.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_reset_log_conf";

struct Entry {
  const char* key;
  const char* message;
};

constexpr Entry kEntries[] = {
    {"last_hash", "Failed to reset last hash in conf"},          // message
    {"tar_log_inode", "Failed to reset tar log inode in conf"},  // message
    {"last_byte", "Failed to reset last log length in conf"},    // message
    {"total_byte", "Failed to reset total byte in conf"},        // message
    {"inode", "Failed to reset inode in conf"},                  // message
};

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELResetLogConf(const char* path) {
  if (ALIBCFileExist(path) == 0) {
    return 0;
  }
  for (const Entry& entry : kEntries) {
    if (ALIBCFileSetKeyValue(path, entry.key, kResetValue, 0) <= 0) {
      QUENDEL_LOG("%s '%s', ret = %d", entry.message, path, ALIBCErrGet());
      return -1;
    }
  }
  return 0;
}
