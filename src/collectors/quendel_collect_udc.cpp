// Runs the user-defined collectors and writes what they printed, as far as it has changed.
#include <json/value.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include "base/json_text.h"
#include "base/log.h"
#include "base/paths.h"
#include "collectors/staged_state.h"
#include "platform/file.h"
#include "platform/owned.h"
#include "platform/process.h"
#include "quendel/collectors.h"
#include "quendel/conf.h"

namespace quendel {
namespace {

using platform::OwnedHash;
using platform::OwnedList;

constexpr char kLogUnit[] = "quendel_collect_udc";

constexpr int kListSize = 512;
constexpr int kStagedHashSize = 128;
constexpr size_t kReadBytes = 1024;
constexpr size_t kHashTextBytes = 64;

using Path = char[256];

// A running collector. Closing waits until it has ended; how it ended does not matter.
class OwnedPipe {
 public:
  explicit OwnedPipe(FILE* stream) : stream_(stream) {}
  ~OwnedPipe() {
    if (stream_ != nullptr) {
      ALIBCPclose(stream_);
    }
  }
  OwnedPipe(const OwnedPipe&) = delete;
  OwnedPipe& operator=(const OwnedPipe&) = delete;

  explicit operator bool() const { return stream_ != nullptr; }
  FILE* get() const { return stream_; }

 private:
  FILE* stream_;
};

// Reads a stream to its end. Returns false when its end could not be reached.
bool ReadAll(FILE* stream, std::string& output) {
  char chunk[kReadBytes] = {};
  size_t got = 0;
  while ((got = fread(chunk, 1, sizeof chunk, stream)) > 0) {
    output.append(chunk, got);
  }
  return ferror(stream) == 0;
}

bool RunCollector(const char* path, std::string& output) {
  if (ALIBCFileExist(path) != 1) {
    QUENDEL_LOG("File '%s' does not exist", path);
    return false;
  }
  if (access(path, X_OK) != 0) {
    QUENDEL_LOG("File '%s' cannot be executed", path);
    return false;
  }
  const OwnedPipe pipe(ALIBCPopen(path, "r", nullptr));
  if (!pipe) {
    QUENDEL_LOG("Failed to popen '%s'", path);
    return false;
  }
  return ReadAll(pipe.get(), output);
}

// Remembers the output that is about to be sent.
bool StageHash(const char* conf, const char* hash, OwnedHash& staged) {
  if (ALIBCSzHashSetValue(staged.slot(), "last_hash", hash) < 0) {
    QUENDEL_LOG("Failed to set hash of conf '%s' to '%s'", conf, hash);
    return false;
  }
  if (!AppendStagedState(kUdcUpdateFile, conf, staged.get())) {
    QUENDEL_LOG("Failed to add new section to '%s'", kUdcUpdateFile);
    return false;
  }
  return true;
}

// What is too much for the memory is no value either.
bool ParseOutput(const std::string& output, Json::Value& value) {
  try {
    return JsonFromText(output, value);
  } catch (...) {
    return false;
  }
}

// Judges what a collector printed and sets its member of the results, or leaves it out.
void TakeOutput(const char* conf, const QUENDELUDCConf_t& record, const std::string& output,
                OwnedHash& staged, Json::Value& results) {
  char hash[kHashTextBytes] = {};
  QUENDELMD5String(output, hash);
  if (strcmp(hash, record.last_hash) == 0) {
    results[record.name] = "Same";
    return;
  }
  ALIBCHashRemoveAll(staged.get());
  Json::Value value;
  if (!ParseOutput(output, value)) {
    QUENDEL_LOG("Failed to set json value of '%s'", record.path);
    return;
  }
  if (StageHash(conf, hash, staged)) {
    results[record.name].swap(value);
  }
}

// Runs one collector. `record` still holds what was read for the one before.
void CollectUdc(const char* conf, QUENDELUDCConf_t& record, OwnedHash& staged,
                Json::Value& results) {
  // Deliberate: a configuration that names no collector is filed under the name that the record
  // holds from the collector before it.
  if (QUENDELGetUDCConf(conf, &record) != 0) {
    QUENDEL_LOG("Failed to get config of '%s'", conf);
    results[record.name] = "Error";
    return;
  }
  std::string output;
  bool ran = false;
  try {
    ran = RunCollector(record.path, output);
  } catch (...) {
    output = std::string();  // it printed more than fits the memory
  }
  if (!ran) {
    QUENDEL_LOG("Failed to get result of udc '%s'", record.path);
    results[record.name] = "Error";
    return;
  }
  TakeOutput(conf, record, output, staged, results);
}

bool WriteResults(const char* path, const Json::Value& results) {
  const std::string text = JsonToText(results);
  FILE* file = fopen(path, "we");
  if (file == nullptr) {
    return false;
  }
  const bool written = fwrite(text.data(), 1, text.size(), file) == text.size();
  return fclose(file) == 0 && written;
}

// Runs them all and writes the results. Returns false when the result file is not whole.
bool CollectAll(const char* dstDir, const OwnedList& names, OwnedHash& staged) {
  Path result = {};
  snprintf(result, sizeof result, "%s/udc.result", dstDir);
  Json::Value results;
  QUENDELUDCConf_t record = {};
  const int count = ALIBCSzListSize(names.get());
  for (int i = 0; i < count; ++i) {
    Path conf = {};
    snprintf(conf, sizeof conf, "%s/%s", kCollectorConfDir, ALIBCSzListGet(names.get(), i));
    CollectUdc(conf, record, staged, results);
  }
  if (!WriteResults(result, results)) {
    QUENDEL_LOG("Failed to open file '%s'", result);
    return false;
  }
  return true;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELCollectUDC(const char* dstDir) try {
  if (ALIBCFileCheckDir(kCollectorConfDir) == 0) {
    QUENDEL_LOG("Dir '%s' dose not exist", kCollectorConfDir);  // [sic]
    return -1;
  }
  OwnedList names(kListSize);
  if (!names) {
    QUENDEL_LOG("Failed to allocate memory for list");
    return -1;
  }
  OwnedHash staged(kStagedHashSize);
  if (!staged) {
    QUENDEL_LOG("Failed to allocate memory for UDC hash");
    return -1;
  }
  if (ALIBCFileExist(kUdcUpdateFile) != 0 && !RemoveStagedState(kUdcUpdateFile)) {
    QUENDEL_LOG("Failed to remove %s [errno=%d]", kUdcUpdateFile, errno);
  }
  if (ALIBCFileEnumDir(kCollectorConfDir, "quendel.udc.", names.slot(),
                       platform::kEnumRegularFiles) < 0) {
    QUENDEL_LOG("Failed to enum dir '%s'", kCollectorConfDir);
    return -1;
  }
  if (!CollectAll(dstDir, names, staged)) {
    // What the results do not tell must not count as told.
    RemoveStagedState(kUdcUpdateFile);
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for list");
  RemoveStagedState(kUdcUpdateFile);
  return -1;
}
