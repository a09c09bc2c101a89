#include "status.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdio>

#include "json.h"

namespace quendeld {
namespace {

constexpr int64_t kFailuresThatCount = 3;

void AddProblem(Json::Value& status, const std::string& problem) {
  status["problems"].append(problem);
}

}  // namespace

void Judge(Json::Value& status) {
  status["problems"] = Json::arrayValue;
  const int64_t failures = NumberOf(Member(status, "heartbeat"), "failures").value_or(0);
  if (failures >= kFailuresThatCount) {
    AddProblem(status,
               "the server has not accepted the last " + std::to_string(failures) + " heartbeats");
  }
  if (BoolOf(Member(status, "collection"), "failing")) {
    AddProblem(status, "the last collection failed");
  }
  for (const Json::Value& log : Member(status, "logs")) {
    if (BoolOf(log, "at_risk")) {
      AddProblem(status, "the next rotation of " + TextOf(log, "path") +
                             " may remove lines that were not collected");
    }
    if (BoolOf(log, "stuck")) {
      AddProblem(status, TextOf(log, "path") + " cannot be continued before the next collection");
    }
  }
  if (NumberOf(Member(status, "outbox"), "archives").value_or(0) > 0) {
    AddProblem(status, "archives wait for the server");
  }
  status["healthy"] = status["problems"].empty();
}

void WriteStatusFile(const Json::Value& status) {
  const std::string draft = std::string(kStatusFile) + ".new";
  const std::string text = JsonLine(status) + "\n";
  const int file = open(draft.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0644);
  const bool written =
      file >= 0 && write(file, text.data(), text.size()) == static_cast<ssize_t>(text.size());
  if (file >= 0) {
    close(file);
  }
  if (!written || rename(draft.c_str(), kStatusFile) != 0) {
    syslog(LOG_ERR, "cannot write %s: %m", kStatusFile);
  }
}

}  // namespace quendeld
