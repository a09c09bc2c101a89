// A collection run, with what has to be looked at before it and cleared away after it.
#include <sys/statvfs.h>
#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <set>

#include "common/collect_lock.h"
#include "json.h"
#include "quendel.h"
#include "worker/device_facts.h"
#include "worker/leftovers.h"
#include "worker/outbox.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

namespace fs = std::filesystem;
using quendel::programs::CollectLock;

constexpr uint64_t kMiB = 1 << 20;

// What a run writes under /tmp: the new lines, and at most as much again for their archive.
uint64_t Need(const std::vector<LogState>& logs) {
  uint64_t bytes = 0;
  for (const LogState& log : logs) {
    bytes += log.lag + 2 * log.archive_lag;
  }
  return 2 * bytes;
}

uint64_t FreeBytes(const char* folder) {
  struct statvfs status = {};
  return statvfs(folder, &status) == 0 ? uint64_t{status.f_bavail} * status.f_frsize : 0;
}

// Returns why there is no room for the run, or an empty text.
std::string NoRoom(const std::vector<LogState>& logs, const Json::Value& request) {
  const uint64_t reserve =
      kMiB * static_cast<uint64_t>(quendeld::NumberOf(request, "free_space_mb").value_or(0));
  const uint64_t need = Need(logs) + reserve;
  if (FreeBytes("/tmp") < need) {
    return "no room in /tmp: the run may need " + std::to_string(need / kMiB) + " MiB, " +
           std::to_string(FreeBytes("/tmp") / kMiB) + " are free";
  }
  const uint64_t limit =
      kMiB * static_cast<uint64_t>(quendeld::NumberOf(request, "outbox_limit_mb").value_or(0));
  const uint64_t inOutbox = DescribeOutbox()["bytes"].asUInt64();
  if (!quendeld::BoolOf(request, "send") && inOutbox + Need(logs) / 2 > limit) {
    return "no room in the outbox: " + std::to_string(inOutbox / kMiB) + " MiB are in it";
  }
  return "";
}

bool IsIn(const Json::Value& list, const std::string& text) {
  return std::any_of(list.begin(), list.end(),
                     [&](const Json::Value& entry) { return entry == text; });
}

// A log that was collected before it held a whole line fails in each run from then on. It is reset
// once; "cured" of the request are those that were. Returns those that are stuck.
Json::Value Cure(const std::vector<LogState>& logs, const Json::Value& request) {
  Json::Value stuck = Json::arrayValue;
  for (const LogState& log : logs) {
    if (!log.is_stuck) {
      continue;
    }
    stuck.append(log.conf);
    if (!IsIn(quendeld::Member(request, "cured"), log.conf)) {
      syslog(LOG_WARNING, "%s was collected before it held a line; it is reset, and sent whole",
             log.path.c_str());
      QUENDELResetLogConf(log.conf.c_str());
    }
  }
  return stuck;
}

// The run's own directory: the one that was not there before.
fs::path NewRunDirectory(const std::set<fs::path>& before) {
  for (const fs::path& directory : RunDirectories()) {
    if (before.count(directory) == 0) {
      return directory;
    }
  }
  return {};
}

// What is left to do after a run that returned.
void Settle(const fs::path& directory, int64_t started, bool send, Json::Value& answer) {
  const fs::path archive = directory.string() + ".tar.xz";
  std::error_code error;
  const uintmax_t bytes = fs::file_size(archive, error);
  answer["bytes"] = static_cast<Json::UInt64>(error ? 0 : bytes);
  if (answer["result"] == 0 && !send && !PutIntoOutbox(archive, started)) {
    // The lines are counted as collected: the archive is all there is of them.
    answer["result"] = -1;
    answer["reason"] = "the archive could not be put into the outbox; it stays " + archive.string();
    return;
  }
  if (!directory.empty()) {
    QUENDELRecursiveRmdir(directory.c_str());
    QUENDELRecursiveRmdir(archive.c_str());
  }
}

Json::Value Refused(const std::string& reason) {
  syslog(LOG_ERR, "no collection: %s", reason.c_str());
  Json::Value answer = Failed();
  answer["reason"] = reason;
  return answer;
}

Json::Value RunCollection(const Json::Value& request) {
  const std::vector<LogState> logs = LogStates();
  const std::string noRoom = NoRoom(logs, request);
  if (!noRoom.empty()) {
    return Refused(noRoom);
  }
  const bool send = quendeld::BoolOf(request, "send");
  const std::set<fs::path> before = RunDirectories();
  const int64_t started = time(nullptr);
  Json::Value answer = Json::objectValue;
  answer["stuck"] = Cure(logs, request);
  const Json::Value& series = quendeld::Member(request, "series");
  answer["result"] =
      QUENDELStartCollect(0, send ? 1 : 0, series.isObject() ? series : Json::objectValue);
  Settle(NewRunDirectory(before), started, send, answer);
  answer["outbox"] = DescribeOutbox();
  return answer;
}

}  // namespace

Json::Value Collect(const Json::Value& request) {
  if (QUENDELIsEnable() == 0) {
    return Disabled();
  }
  CollectLock lock("quendeld");
  switch (lock.Take()) {
    case CollectLock::Result::kTaken:
      return RunCollection(request);
    case CollectLock::Result::kHeld: {
      Json::Value answer =
          Refused("process " + std::to_string(lock.holder().process) + " is collecting");
      answer["busy"] = true;
      return answer;
    }
    case CollectLock::Result::kFailed:
      break;
  }
  return Refused(std::string("the lock cannot be taken: ") + strerror(errno));
}

}  // namespace quendel_worker
