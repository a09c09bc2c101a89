#include "action.h"

#include <algorithm>
#include <limits>

#include "json.h"

namespace quendeld {
namespace {

constexpr int kFailed = -1;
constexpr size_t kMostFaults = 5;

// The ones that change nothing here are the server's own notes of what the device told it.
enum class Kind { kCarriedOut, kPower, kRefused };

struct Known {
  const char* name;
  Kind kind;
};

constexpr Known kActions[] = {
    {"upload_file", Kind::kCarriedOut},   {"remote_close", Kind::kCarriedOut},
    {"start_collect", Kind::kCarriedOut}, {"update_info", Kind::kCarriedOut},
    {"poweroff", Kind::kPower},           {"reboot", Kind::kPower},
    {"enable", Kind::kRefused},           {"disable", Kind::kRefused},
    {"logout", Kind::kRefused},
};

std::optional<int> IdOf(const Json::Value& action) {
  const std::optional<int64_t> id = NumberOf(action, "request_id");
  const bool isInt =
      id && *id >= std::numeric_limits<int>::min() && *id <= std::numeric_limits<int>::max();
  return isInt ? std::optional<int>(static_cast<int>(*id)) : std::nullopt;
}

// Returns what is wrong with the action, or an empty text.
std::string FaultOf(const Json::Value& action, bool allowPower) {
  const std::string name = TextOf(action, "action");
  const auto* known = std::find_if(std::begin(kActions), std::end(kActions),
                                   [&](const Known& one) { return name == one.name; });
  if (known == std::end(kActions)) {
    return "an unknown action";
  }
  if (known->kind == Kind::kRefused || (known->kind == Kind::kPower && !allowPower)) {
    return "the action " + name + ", which is not carried out here";
  }
  if (!Member(action, "progress").isNull()) {
    const std::optional<int64_t> progress = NumberOf(action, "progress");
    if (!progress || *progress < -1 || *progress > 1) {
      return "an unknown progress";
    }
  }
  if (name == "upload_file" && !Member(action, "files").isArray()) {
    return "no list of files";
  }
  return "";
}

int ProgressOf(const Json::Value& action) {
  return static_cast<int>(NumberOf(action, "progress").value_or(1));
}

void AddFault(ReadActions& read, const std::string& fault) {
  if (read.faults.size() < kMostFaults) {
    read.faults.push_back(fault);
  } else if (read.faults.size() == kMostFaults) {
    read.faults.push_back("there is more that is wrong");
  }
}

void AddRequest(ReadActions& read, const Json::Value& action, int id, bool isTooMany,
                bool allowPower) {
  const std::string fault =
      isTooMany ? "one action too many at a time" : FaultOf(action, allowPower);
  NewRequest request;
  request.id = id;
  request.action = TextOf(action, "action").substr(0, 64);
  if (fault.empty()) {
    request.progress = ProgressOf(action);
    request.files = Member(action, "files");
  } else {
    request.report = kFailed;
    request.fault = fault;
  }
  read.requests.push_back(request);
}

}  // namespace

ReadActions ActionsFromJson(const Json::Value& actions, int64_t most, bool allowPower) {
  ReadActions read;
  if (!actions.isNull() && !actions.isArray()) {
    AddFault(read, "the actions are no list");
    return read;
  }
  for (const Json::Value& action : actions) {
    const std::optional<int> id = IdOf(action);
    if (id) {
      const bool isTooMany = static_cast<int64_t>(read.requests.size()) >= most;
      AddRequest(read, action, *id, isTooMany, allowPower);
    } else {
      AddFault(read, "an action without a request_id that is a number");
    }
  }
  return read;
}

}  // namespace quendeld
