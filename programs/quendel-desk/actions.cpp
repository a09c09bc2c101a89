// The actions that a supporter may ask of a device.
#include "actions.h"

#include <algorithm>
#include <regex>
#include <stdexcept>

#include "crypto.h"
#include "json.h"

namespace quendeldesk {
namespace {

constexpr const char* kActions[] = {"upload_file", "remote_close", "start_collect",
                                    "enable",      "disable",      "poweroff",
                                    "reboot",      "logout",       "update_info"};
constexpr unsigned kMostFiles = 5;  // a device refuses a longer list
constexpr size_t kUuidBytes = 16;
constexpr long long kDay = 24LL * 60 * 60;
constexpr long long kExpiresIn = 7 * kDay;
constexpr long long kLongest = 365 * kDay;

void Require(bool holds, const std::string& what) {
  if (!holds) {
    throw std::invalid_argument(what);
  }
}

// A device sends no file but its debug archive and crash dumps in their places.
Json::Value FileFrom(const Json::Value& file) {
  static const std::regex kDumps("(/var/crash/|/volume[0-9]+/)@.+\\.core");
  const std::string type = TextMember(file, "file_type");
  const std::string path = TextMember(file, "file_path");
  Require(type == "coredump" || type == "debug.dat",
          "a file's \"file_type\" is \"coredump\" or \"debug.dat\"");
  Require(type == "debug.dat" || std::regex_match(path, kDumps),
          "no device sends " + path + ": a crash dump is /var/crash/@*.core or /volumeN/@*.core");
  const std::string uuid = TextMember(file, "file_uuid");
  Json::Value checked;
  checked["file_type"] = type;
  checked["file_path"] = path;
  checked["file_uuid"] = uuid.empty() ? RandomHex(kUuidBytes) : uuid;
  return checked;
}

Json::Value FilesFrom(const Json::Value& files) {
  Require(files.isArray() && !files.empty(), "\"upload_file\" needs a list \"files\"");
  Require(files.size() <= kMostFiles, "a device sends five files at most");
  Json::Value checked(Json::arrayValue);
  for (const Json::Value& file : files) {
    checked.append(FileFrom(file));
  }
  return checked;
}

}  // namespace

NewAction ActionFrom(const Json::Value& request, long long now) {
  Require(request.isObject(), "an action is a JSON object");
  NewAction action;
  action.name = TextMember(request, "action");
  Require(std::find(std::begin(kActions), std::end(kActions), action.name) != std::end(kActions),
          "there is no action \"" + action.name + "\"");
  const bool close = action.name == "remote_close";
  const Json::Value progress = request.get("progress", close ? 0 : 1);
  Require(progress == 1 ? !close : close && (progress == 0 || progress == -1),
          "\"progress\" is 0 or -1 for \"remote_close\", and 1 for every other action");
  action.body["progress"] = progress;
  if (action.name == "upload_file") {
    action.body["files"] = FilesFrom(request["files"]);
  }
  const Json::Value expires = request.get("expires_in", static_cast<Json::Int64>(kExpiresIn));
  Require(expires.isInt64() && expires.asInt64() > 0 && expires.asInt64() <= kLongest,
          "\"expires_in\" is a number of seconds, a year at most");
  action.expires_at = now + expires.asInt64() * 1000;
  return action;
}

}  // namespace quendeldesk
