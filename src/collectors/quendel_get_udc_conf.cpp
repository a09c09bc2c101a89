// Reads the configuration and state of one user-defined collector.
#include <cstddef>

#include "base/log.h"
#include "platform/error.h"
#include "platform/key_value.h"
#include "quendel/collectors.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_get_udc_conf";

struct Entry {
  const char* key;
  size_t size;
  char* (*field)(QUENDELUDCConf_t& conf);
  const char* message;
};

template <auto field>
char* Field(QUENDELUDCConf_t& conf) {
  return conf.*field;
}

constexpr Entry kEntries[] = {
    {"name", sizeof(QUENDELUDCConf_t::name), Field<&QUENDELUDCConf_t::name>,
     "Failed to find bin name in conf"},  // message
    {"path", sizeof(QUENDELUDCConf_t::path), Field<&QUENDELUDCConf_t::path>,
     "Failed to find bin path in conf"},  // message
    {"last_hash", sizeof(QUENDELUDCConf_t::last_hash), Field<&QUENDELUDCConf_t::last_hash>,
     "Failed to find last hash value in conf"},  // message
};

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetUDCConf(const char* path, QUENDELUDCConf_t* conf) {
  if (conf == nullptr) {
    QUENDEL_LOG("Bad parameter");
    return -1;
  }
  for (const Entry& entry : kEntries) {
    const int size = static_cast<int>(entry.size);
    if (ALIBCFileGetKeyValue(path, entry.key, entry.field(*conf), size, 0) <= 0) {
      QUENDEL_LOG("%s '%s', ret = %d", entry.message, path, ALIBCErrGet());
      return -1;
    }
  }
  return 0;
}
