#include "worker/device_facts.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <sstream>

#include "base/paths.h"
#include "platform/device.h"
#include "quendel.h"
#include "worker/outbox.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

constexpr char kLogPrefix[] = "quendel.log.";

std::string SerialNumber() {
  char serial[36] = {};
  return ALIBGetSerialNumber(serial, sizeof serial) < 0 ? "" : serial;
}

Json::Value DeviceInfo() {
  char model[64] = {};
  char version[64] = {};
  char host[256] = {};
  QUENDELGetHMXModel(model, sizeof model);
  QUENDELGetHMXVersion(version, sizeof version);
  gethostname(host, sizeof host - 1);
  Json::Value info = Json::objectValue;
  info["model"] = model;
  info["version"] = version;
  info["hostname"] = host;
  info["serial"] = SerialNumber();
  return info;
}

std::vector<std::string> LogConfs() {
  namespace fs = std::filesystem;
  std::vector<std::string> confs;
  std::error_code error;
  for (fs::directory_iterator entry(quendel::kCollectorConfDir, error);
       !error && entry != fs::directory_iterator(); entry.increment(error)) {
    std::error_code ignored;  // what cannot be examined is no settings file
    if (entry->path().filename().string().rfind(kLogPrefix, 0) == 0 &&
        entry->is_regular_file(ignored)) {
      confs.push_back(entry->path());
    }
  }
  std::sort(confs.begin(), confs.end());
  return confs;
}

bool HoldsALine(const std::string& path) {
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (file < 0) {
    return false;
  }
  char part[65536];
  ssize_t got = 0;
  bool found = false;
  while (!found && (got = read(file, part, sizeof part)) > 0) {
    found = memchr(part, '\n', static_cast<size_t>(got)) != nullptr;
  }
  close(file);
  return found;
}

bool IsListed(const std::string& list, const std::string& entry) {
  std::istringstream entries(list);
  for (std::string one; std::getline(entries, one, ',');) {
    if (one == entry) {
      return true;
    }
  }
  return false;
}

// Archives are numbered from 1, the youngest, without a gap.
void LookAtArchives(const QUENDELLogConf_t& conf, LogState& state) {
  struct stat archive = {};
  for (int number = 1;; ++number) {
    const std::string path = state.path + "." + std::to_string(number) + ".xz";
    if (stat(path.c_str(), &archive) != 0) {
      return;
    }
    state.is_at_risk = !IsListed(conf.tar_log_inode, std::to_string(archive.st_ino));
    if (state.is_at_risk) {
      state.archive_lag += static_cast<uint64_t>(archive.st_size);
    }
  }
}

void LookAtLiveLog(const QUENDELLogConf_t& conf, LogState& state) {
  struct stat live = {};
  if (stat(state.path.c_str(), &live) != 0 || !S_ISREG(live.st_mode)) {
    state.has_line = true;  // nothing to wait for
    return;
  }
  const bool isKnown = live.st_ino == conf.inode && live.st_size >= conf.total_byte;
  state.lag = static_cast<uint64_t>(isKnown ? live.st_size - conf.total_byte : live.st_size);
  state.has_line = HoldsALine(state.path);
  // The line before what is new would begin before the file.
  const bool hasNoLineToGoOnFrom = conf.total_byte - conf.last_byte - 1 < 0;
  state.is_stuck =
      live.st_ino == conf.inode && hasNoLineToGoOnFrom && state.lag > 0 && state.has_line;
}

}  // namespace

Json::Value DeviceFacts() {
  Json::Value facts = Json::objectValue;
  facts["enabled"] = QUENDELIsEnable() != 0;
  facts["host"] = QUENDELGetServerHost();
  facts["info"] = DeviceInfo();
  QUENDELConf_t conf;
  facts["contact"] = QUENDELGetConf(&conf) == 0 ? conf.contact : Json::Value();
  struct stat session = {};
  if (stat(quendel::kRemoteConfFile, &session) == 0) {
    facts["session"] = static_cast<Json::Int64>(session.st_mtime);
  }
  return facts;
}

std::vector<LogState> LogStates() {
  std::vector<LogState> states;
  for (const std::string& file : LogConfs()) {
    QUENDELLogConf_t conf = {};
    if (QUENDELGetLogConf(file.c_str(), &conf) == 0) {
      LogState state;
      state.conf = file;
      state.name = conf.name;
      state.path = conf.path;
      LookAtArchives(conf, state);
      LookAtLiveLog(conf, state);
      states.push_back(state);
    }
  }
  return states;
}

Json::Value Look(const Json::Value& request) {
  Json::Value answer = TellFacts(request);
  answer["logs"] = Json::arrayValue;
  for (const LogState& state : LogStates()) {
    Json::Value log = Json::objectValue;
    log["name"] = state.name;
    log["path"] = state.path;
    log["lag_bytes"] = static_cast<Json::UInt64>(state.lag);
    log["archive_lag_bytes"] = static_cast<Json::UInt64>(state.archive_lag);
    log["at_risk"] = state.is_at_risk;
    log["stuck"] = state.is_stuck;
    log["has_line"] = state.has_line;
    answer["logs"].append(log);
  }
  answer["outbox"] = DescribeOutbox();
  return answer;
}

}  // namespace quendel_worker
