// Reads the configuration and state of one log.
#include <cctype>
#include <cstdlib>
#include <cstring>

#include "base/log.h"
#include "platform/error.h"
#include "platform/key_value.h"
#include "quendel/collectors.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_get_log_conf";

constexpr size_t kScratchBytes = 256;

int64_t ParseNumber(const char* text) {
  return isdigit(static_cast<unsigned char>(text[0])) ? strtoll(text, nullptr, 10) : 0;
}

// An inode number may be wider than its field, which keeps its low 32 bits.
uint32_t ParseInode(const char* text) {
  const bool isNumber = isdigit(static_cast<unsigned char>(text[0]));
  return isNumber ? static_cast<uint32_t>(strtoull(text, nullptr, 10)) : 0;
}

struct Entry {
  const char* key;
  size_t size;
  void (*set)(QUENDELLogConf_t& conf, const char* value);
  const char* message;
};

// The value is no longer than the field, because it was read with the field's size.
template <auto field>
void SetText(QUENDELLogConf_t& conf, const char* value) {
  memcpy(conf.*field, value, sizeof(conf.*field));
}

template <auto field>
void SetNumber(QUENDELLogConf_t& conf, const char* value) {
  conf.*field = ParseNumber(value);
}

void SetInode(QUENDELLogConf_t& conf, const char* value) {
  conf.inode = ParseInode(value);
}

constexpr Entry kEntries[] = {
    {"name", sizeof(QUENDELLogConf_t::name), SetText<&QUENDELLogConf_t::name>,
     "Failed to find log name in conf"},  // message
    {"path", sizeof(QUENDELLogConf_t::path), SetText<&QUENDELLogConf_t::path>,
     "Failed to find log path in conf"},  // message
    {"last_hash", sizeof(QUENDELLogConf_t::last_hash), SetText<&QUENDELLogConf_t::last_hash>,
     "Failed to find last hash in conf"},  // message
    {"tar_log_inode", sizeof(QUENDELLogConf_t::tar_log_inode),
     SetText<&QUENDELLogConf_t::tar_log_inode>, "Failed to find tar log inode in conf"},  // message
    {"last_byte", kScratchBytes, SetNumber<&QUENDELLogConf_t::last_byte>,
     "Failed to find last log length in conf"},  // message
    {"total_byte", kScratchBytes, SetNumber<&QUENDELLogConf_t::total_byte>,
     "Failed to find total byte in conf"},                               // message
    {"inode", kScratchBytes, SetInode, "Failed to find inode in conf"},  // message
};

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetLogConf(const char* path, QUENDELLogConf_t* conf) {
  if (conf == nullptr) {
    QUENDEL_LOG("Bad parameter");
    return -1;
  }
  for (const Entry& entry : kEntries) {
    char value[kScratchBytes] = {};
    if (ALIBCFileGetKeyValue(path, entry.key, value, static_cast<int>(entry.size), 0) <= 0) {
      QUENDEL_LOG("%s '%s', ret = %d", entry.message, path, ALIBCErrGet());
      return -1;
    }
    entry.set(*conf, value);
  }
  return 0;
}
