// Forgets what one user-defined collector printed last.
#include "base/log.h"
#include "collectors/reset_value.h"
#include "platform/error.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "quendel/collectors.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_reset_udc_conf";

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELResetUDCConf(const char* path) {
  if (ALIBCFileExist(path) == 0) {
    return 0;
  }
  if (ALIBCFileSetKeyValue(path, "last_hash", kResetValue, 0) <= 0) {
    QUENDEL_LOG("Failed to reset lash hash value in conf '%s', ret = %d",  // [sic]
                path, ALIBCErrGet());
    return -1;
  }
  return 0;
}
