// Commits the staged state of the collectors into their configuration files.
#include "base/log.h"
#include "collectors/staged_state.h"
#include "platform/error.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "quendel/collectors.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_update_conf";

constexpr int kSectionListSize = 512;
constexpr int kKeyListSize = 128;
constexpr int kPairHashSize = 128;

// The keys are written in the order in which the platform lists them, in which every prefix is
// safe: cut short anywhere, it makes the next collection repeat lines and never pass over any.
void WritePairs(const char* conf, ALIBSZHASH* pairs, const ALIBSZLIST* keys) {
  const int count = ALIBCSzListSize(keys);
  for (int i = 0; i < count; ++i) {
    const char* key = ALIBCSzListGet(keys, i);
    const char* value = ALIBCSzHashGetValue(pairs, key);
    if (ALIBCFileSetKeyValue(conf, key, value, 0) < 0) {
      QUENDEL_LOG("Failed to set key-value pair: (%s, %s) of config '%s', ret = %d", key, value,
                  conf, ALIBCErrGet());
      return;
    }
  }
}

// The name of a section is the path of the file that its pairs go to.
void CommitSection(const char* updateFile, const char* section, platform::OwnedHash& pairs,
                   platform::OwnedList& keys) {
  ALIBCHashRemoveAll(pairs.get());
  ALIBCSzListRemoveAll(keys.get());
  if (ALIBCFileGetSection(updateFile, section, pairs.slot()) <= 0) {
    QUENDEL_LOG("Failed to get key-value pair of section '%s'", section);
    return;
  }
  if (ALIBCSzHashEnumKey(pairs.get(), keys.slot()) < 0) {
    QUENDEL_LOG("Failed to enum all key of section '%s'", section);
    return;
  }
  WritePairs(section, pairs.get(), keys.get());
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELUpdateCollectConf(const char* path) {
  if (ALIBCFileExist(path) == 0) {
    return 0;
  }
  platform::OwnedList sections(kSectionListSize);
  if (!sections) {
    QUENDEL_LOG("Failed to allocate memory for list");
    return -1;
  }
  platform::OwnedList keys(kKeyListSize);
  if (!keys) {
    QUENDEL_LOG("Failed to allocate memory for list");
    return -1;
  }
  platform::OwnedHash pairs(kPairHashSize);
  if (!pairs) {
    QUENDEL_LOG("Failed to allocate memory for hash");
    return -1;
  }
  if (!MayBeCommitted(path) || ALIBCFileEnumSection(path, sections.slot()) < 0) {
    QUENDEL_LOG("Failed to enum section of '%s'", path);
    return -1;
  }
  const int count = ALIBCSzListSize(sections.get());
  for (int i = 0; i < count; ++i) {
    CommitSection(path, ALIBCSzListGet(sections.get(), i), pairs, keys);
  }
  return 0;
}
