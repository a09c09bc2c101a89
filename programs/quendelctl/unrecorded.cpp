// What a collection run delivered and did not record as collected.
#include "unrecorded.h"

#include <json/reader.h>

#include <cstring>
#include <fstream>
#include <memory>
#include <optional>

#include "base/paths.h"
#include "collector_files.h"
#include "platform/key_value.h"
#include "platform/owned.h"

namespace quendelctl {
namespace {

using platform::OwnedHash;
using platform::OwnedList;

constexpr int kContainerSize = 128;
constexpr int kValueBytes = 4096;

std::string ValueIn(const std::string& path, const char* key) {
  std::string value(kValueBytes, '\0');
  if (ALIBCFileGetKeyValue(path.c_str(), key, value.data(), kValueBytes, 0) <= 0) {
    return "";
  }
  return value.c_str();
}

// Returns why the collector of this settings file was not recorded, if it was not.
std::optional<std::string> WhyNot(const char* updateFile, const std::string& conf) {
  OwnedHash staged(kContainerSize);
  OwnedList keys(kContainerSize);
  if (!staged || !keys) {
    return std::nullopt;
  }
  if (ALIBCFileGetSection(updateFile, conf.c_str(), staged.slot()) <= 0 ||
      ALIBCSzHashEnumKey(staged.get(), keys.slot()) < 0) {
    return std::string("its state could not be noted in ") + updateFile;
  }
  for (int i = 0; i < ALIBCSzListSize(keys.get()); ++i) {
    const char* const key = ALIBCSzListGet(keys.get(), i);
    if (ValueIn(conf, key) != ALIBCSzHashGetValue(staged.get(), key)) {
      return "its state could not be written to " + conf;
    }
  }
  return std::nullopt;
}

// What the user-defined collectors have printed, by their names. A result that says "Same" or
// "Error" in place of it is no news.
Json::Value ReadResults(const RunWatch& run) {
  std::ifstream file(run.Directory() + "/udc/udc.result");
  Json::Value results;
  std::string errors;
  try {
    if (!Json::parseFromStream(Json::CharReaderBuilder(), file, &results, &errors)) {
      return Json::nullValue;
    }
  } catch (const std::exception&) {  // nested too deep
    return Json::nullValue;
  }
  return results.isObject() ? results : Json::Value();
}

bool IsNews(const Json::Value& results, const std::string& name) {
  return results.isMember(name) && results[name] != "Same" && results[name] != "Error";
}

}  // namespace

std::vector<Unrecorded> FindUnrecorded(const RunWatch& run) {
  std::vector<Unrecorded> found;
  const auto examine = [&](const std::string& file, const char* updateFile, auto hasNews) {
    const std::string conf = std::string(quendel::kCollectorConfDir) + "/" + file;
    const std::string name = ValueIn(conf, "name");
    if (hasNews(name)) {
      if (const auto reason = WhyNot(updateFile, conf)) {
        found.push_back({name, *reason});
      }
    }
  };
  const std::set<std::string> logs =
      run.Directory().empty() ? std::set<std::string>() : run.Logs(1);
  for (const std::string& file : CollectorFiles(kLogPrefix)) {
    examine(file, quendel::kLogUpdateFile, [&](const auto& name) { return logs.count(name) > 0; });
  }
  const Json::Value results = ReadResults(run);
  for (const std::string& file : CollectorFiles(kUdcPrefix)) {
    examine(file, quendel::kUdcUpdateFile, [&](const auto& name) { return IsNews(results, name); });
  }
  return found;
}

}  // namespace quendelctl
