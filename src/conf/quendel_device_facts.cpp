// The device's model and version, the local time, and the name of a fresh work directory.
#include <cstdio>
#include <cstring>

#include "base/log.h"
#include "base/paths.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "quendel/conf.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_device_facts";

constexpr int kVersionHashSize = 512;

// Which lock this is, is the platform's own affair. It is released whenever the name was asked for.
constexpr int kModelFileLock = 0x800;

const char* TextOrEmpty(const char* text) {
  return text == nullptr ? "" : text;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetHMXModel(char* buf, size_t size) {
  int result = 0;
  char model[64] = {};
  if (ALIBCFileGetKeyValue(kDefaultsFile, "upnpmodelname", model, sizeof model, 0) < 0) {
    QUENDEL_LOG("Failed to get model name");
    result = -1;
  } else {
    snprintf(buf, size, "%s", model);
  }
  ALIBCFileUnlock(kModelFileLock);  // Deliberate: also after a failed read.
  return result;
}

int QUENDELGetHMXVersion(char* buf, size_t size) {
  platform::OwnedHash hash(kVersionHashSize);
  if (!hash) {
    QUENDEL_LOG("Failed to allocate memory for hash");
    return -1;
  }
  // Deliberate: a file that cannot be read leaves the version's places empty; it is not an error.
  ALIBCFileGetPair(kVersionFile, hash.slot());

  const char* major = TextOrEmpty(ALIBCSzHashGetValue(hash.get(), "majorversion"));
  const char* minor = TextOrEmpty(ALIBCSzHashGetValue(hash.get(), "minorversion"));
  const char* build = TextOrEmpty(ALIBCSzHashGetValue(hash.get(), "buildnumber"));
  const char* update = ALIBCSzHashGetValue(hash.get(), "smallfixnumber");
  if (update != nullptr && strcmp(update, "0") != 0) {
    snprintf(buf, size, "HMX %s.%s-%s Update %s", major, minor, build, update);
  } else {
    snprintf(buf, size, "HMX %s.%s-%s", major, minor, build);
  }
  return 0;
}

int QUENDELGetLocalTime(char* buf, size_t size, time_t when) {
  const tm* local = localtime(&when);
  if (local == nullptr) {
    snprintf(buf, size, "%s", "");
    return -1;
  }
  return snprintf(buf, size, "%ld%02d%02d_%02d%02d%02d", local->tm_year + 1900L, local->tm_mon + 1,
                  local->tm_mday, local->tm_hour, local->tm_min, local->tm_sec);
}

int QUENDELGetDstDir(char* buf, size_t size, time_t when) {
  char stamp[32] = {};
  QUENDELGetLocalTime(stamp, sizeof stamp, when);

  int taken = 0;
  bool fits = false;
  int n = 0;
  do {
    const int length = snprintf(buf, size, "/tmp/quendel_%s_%d", stamp, n);
    fits = length >= 0 && static_cast<size_t>(length) < size;
    taken = ALIBCFileCheckDir(buf);
    ++n;
    // A name that was cut does not change with n, so a taken one would be asked about for ever.
  } while (taken == 1 && fits);
  return taken;
}
