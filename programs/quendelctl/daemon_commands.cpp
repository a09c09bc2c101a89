// The commands that ask quendeld, and those that only it can carry out.
#include "daemon_commands.h"

#include <json/reader.h>
#include <json/writer.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <memory>

#include "common/control_socket.h"

namespace quendelctl {
namespace {

constexpr int kExitDegraded = 1;
constexpr int kExitNotRunning = 3;

// Whether a daemon was there, and what it said.
struct Answer {
  bool came = false;
  std::string problem;  // why none came
  Json::Value members = Json::objectValue;
};

Answer Ask(const Json::Value& request) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  Answer answer;
  const auto line = quendel::programs::AskDaemon(Json::writeString(builder, request));
  if (!line) {
    answer.problem = strerror(errno);
    return answer;
  }
  Json::Value members;
  answer.came = Json::Reader(Json::Features::strictMode()).parse(*line, members) &&
                members.isObject() && members["success"].isBool();
  answer.problem = answer.came ? "" : "its answer cannot be read";
  answer.members = answer.came ? members : Json::Value(Json::objectValue);
  return answer;
}

Answer Ask(const char* command) {
  Json::Value request = Json::objectValue;
  request["command"] = command;
  return Ask(request);
}

Result NotRunning(const Answer& answer) {
  Result result;
  result.lines = {"quendeld does not run: " + answer.problem + "."};
  return result;
}

// The daemon's answer, in the words of this program.
Result Told(const Answer& answer, const std::string& success, const std::string& failure) {
  Result result;
  result.members = answer.members;
  result.success = answer.members["success"].asBool();
  result.lines = {result.success ? success
                                 : failure + ": " + answer.members["reason"].asString() + "."};
  return result;
}

Result AskAndTell(const char* command, const std::string& success, const std::string& failure) {
  const Answer answer = Ask(command);
  return answer.came ? Told(answer, success, failure) : NotRunning(answer);
}

// ---- status

std::string LocalTime(const Json::Value& moment) {
  const time_t seconds = static_cast<time_t>(moment.asInt64());
  tm local = {};
  char text[32] = {};
  localtime_r(&seconds, &local);
  strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local);
  return text;
}

std::string Count(const Json::Value& number, const char* what) {
  const std::string text = number.asString() + " " + what;
  return number == 1 ? text : text + "s";
}

std::string DescribeSwitch(const Json::Value& status) {
  const std::string state = status["enabled"].isNull()   ? "not known yet"
                            : status["enabled"].asBool() ? "enabled"
                                                         : "disabled";
  return "Service:    " + state + (status["paused"].asBool() ? ", paused" : "");
}

std::string DescribeHeartbeat(const Json::Value& heartbeat) {
  const std::string last =
      heartbeat["last"].isNull() ? "none accepted yet" : "accepted " + LocalTime(heartbeat["last"]);
  const std::string failures =
      heartbeat["failures"] == 0 ? "" : ", " + Count(heartbeat["failures"], "failure") + " since";
  return "Heartbeat:  " + last + failures + ", next in " + heartbeat["next_in"].asString() + " s";
}

std::string DescribeRun(const Json::Value& run) {
  const std::string told = run["reason"].asString();
  const std::string reason = told.empty() ? "" : ": " + told;
  return LocalTime(run["started"]) + "  " + run["result"].asString() + "  " +
         run["bytes"].asString() + " bytes  (" + run["cause"].asString() + ")" + reason;
}

std::string DescribeCollection(const Json::Value& collection) {
  const std::string last =
      collection["last"].isNull() ? "none yet" : DescribeRun(collection["last"]);
  return "Collection: " + last + (collection["running"].asBool() ? ", one is running" : "");
}

std::string DescribeLog(const Json::Value& log) {
  std::string text = "Log:        " + log["path"].asString() + ", " + log["lag_bytes"].asString() +
                     " bytes to collect";
  if (log["archive_lag_bytes"] != 0) {
    text += " and " + log["archive_lag_bytes"].asString() + " in archives";
  }
  return text;
}

std::string DescribeWaiting(const Json::Value& status) {
  return "Waiting:    " + Count(status["events"], "event") + ", " +
         Count(status["reports"], "report") + ", " + Count(status["actions"], "action") + ", " +
         Count(status["outbox"]["archives"], "archive");
}

std::vector<std::string> StatusLines(const Json::Value& status) {
  std::vector<std::string> lines = {
      DescribeSwitch(status), "Server:     " + status["host"].asString(),
      DescribeHeartbeat(status["heartbeat"]), DescribeCollection(status["collection"])};
  for (const Json::Value& log : status["logs"]) {
    lines.push_back(DescribeLog(log));
  }
  lines.push_back(DescribeWaiting(status));
  if (!status["session"].isNull()) {
    lines.push_back("Support:    a session is open since " + LocalTime(status["session"]) +
                    ", closed in " + status["session_closes_in"].asString() + " s at the latest");
  }
  for (const Json::Value& problem : status["problems"]) {
    lines.push_back("Problem:    " + problem.asString());
  }
  if (status["problems"].empty()) {
    lines.emplace_back("All is well.");
  }
  return lines;
}

// A label's value: a path may hold anything but NUL.
std::string Label(const std::string& text) {
  std::string escaped;
  for (const char c : text) {
    escaped += c == '\\' || c == '"' ? std::string("\\") + c
               : c == '\n'           ? "\\n"
                                     : std::string(1, c);
  }
  return escaped;
}

std::string Metric(const std::string& name, const std::string& help, const Json::Value& value) {
  const std::string number = value.isBool()   ? (value.asBool() ? "1" : "0")
                             : value.isNull() ? "0"
                                              : value.asString();
  return "# HELP " + name + " " + help + "\n# TYPE " + name + " gauge\n" + name + " " + number +
         "\n";
}

std::string LogMetric(const Json::Value& logs, const char* name, const char* member,
                      const char* help) {
  std::string text = std::string("# HELP ") + name + " " + help + "\n# TYPE " + name + " gauge\n";
  for (const Json::Value& log : logs) {
    text += std::string(name) + "{path=\"" + Label(log["path"].asString()) + "\"} " +
            log[member].asString() + "\n";
  }
  return text;
}

std::string Metrics(const Json::Value& status) {
  const Json::Value& last = status["collection"]["last"];
  return Metric("quendeld_up", "Whether quendeld runs", true) +
         Metric("quendeld_healthy", "Whether it has no problem to tell of", status["healthy"]) +
         Metric("quendeld_enabled", "Whether the service is enabled", status["enabled"]) +
         Metric("quendeld_paused", "Whether the service is paused", status["paused"]) +
         Metric("quendeld_heartbeat_last_seconds",
                "When the server accepted the last heartbeat, seconds since the epoch",
                status["heartbeat"]["last"]) +
         Metric("quendeld_heartbeat_failures", "Heartbeats that failed since",
                status["heartbeat"]["failures"]) +
         Metric("quendeld_collection_last_seconds",
                "When the last collection began, seconds since the epoch", last["started"]) +
         Metric("quendeld_collection_last_bytes", "Bytes of its archive", last["bytes"]) +
         Metric("quendeld_collection_failing", "Whether it failed",
                status["collection"]["failing"]) +
         Metric("quendeld_events_queued", "Events that wait for the server", status["events"]) +
         Metric("quendeld_reports_queued", "Reports that wait for the server", status["reports"]) +
         Metric("quendeld_outbox_archives", "Archives that wait for the server",
                status["outbox"]["archives"]) +
         Metric("quendeld_outbox_bytes", "Their bytes", status["outbox"]["bytes"]) +
         Metric("quendeld_session_open_seconds",
                "When the open support session was opened, seconds since the epoch, or 0",
                status["session"]) +
         LogMetric(status["logs"], "quendeld_log_lag_bytes", "lag_bytes",
                   "Bytes of the log that were not collected") +
         LogMetric(status["logs"], "quendeld_log_archive_lag_bytes", "archive_lag_bytes",
                   "Bytes of its archives that were not collected");
}

Result ShowStatus(bool prometheus) {
  const Answer answer = Ask("status");
  if (!answer.came) {
    Result result = NotRunning(answer);
    result.exit_status = kExitNotRunning;
    if (prometheus) {
      result.lines.clear();
      result.bytes = Metric("quendeld_up", "Whether quendeld runs", false);
    }
    return result;
  }
  Result result;
  result.success = true;
  result.members = answer.members;
  if (prometheus) {
    result.bytes = Metrics(answer.members);
  } else {
    result.lines = StatusLines(answer.members);
  }
  if (!answer.members["healthy"].asBool()) {
    result.exit_status = kExitDegraded;
  }
  return result;
}

Action DeclareStatus(CLI::App& command) {
  const auto prometheus = std::make_shared<bool>(false);
  command.add_flag("--prometheus", *prometheus,
                   "Print metrics, for the text folder of Prometheus's node-exporter");
  return [prometheus] { return ShowStatus(*prometheus); };
}

// ---- pause, resume, history

Action DeclarePause(CLI::App& /*command*/) {
  return [] {
    return AskAndTell("pause", "The service is paused: nothing is sent until it is resumed.",
                      "The service could not be paused");
  };
}

Action DeclareResume(CLI::App& /*command*/) {
  return [] {
    return AskAndTell("resume", "The service goes on.", "The service could not be resumed");
  };
}

Result ShowHistory() {
  const Answer answer = Ask("history");
  if (!answer.came) {
    return NotRunning(answer);
  }
  Result result;
  result.success = true;
  result.members = answer.members;
  for (const Json::Value& run : answer.members["runs"]) {
    result.lines.push_back(DescribeRun(run));
  }
  if (result.lines.empty()) {
    result.lines = {"No collection has run yet."};
  }
  return result;
}

Action DeclareHistory(CLI::App& /*command*/) {
  return ShowHistory;
}

}  // namespace

Result HaveDaemonBeat() {
  return AskAndTell("heartbeat", "The server accepted the heartbeat.", "The heartbeat failed");
}

Result HaveDaemonCollect() {
  return AskAndTell("collect", "The collection is complete, and the server accepted it.",
                    "The collection failed");
}

std::optional<Result> HaveDaemonSendLogout() {
  const Answer answer = Ask("logout");
  if (!answer.came) {
    return std::nullopt;
  }
  return Told(answer, "The server was told of the logout.",
              "The server was not told of the logout");
}

std::optional<Result> HaveDaemonCloseSession(int id, int progress) {
  Json::Value request = Json::objectValue;
  request["command"] = "remote_close";
  request["id"] = id;
  request["progress"] = progress;
  const Answer answer = Ask(request);
  if (!answer.came) {
    return std::nullopt;
  }
  return Told(answer, "The remote session is closed, and the server was told.",
              "The remote session was not closed");
}

std::vector<Command> DaemonCommands() {
  return {
      {"status", "Show how the service is doing",
       R"(Exit status: 0 all is well, 1 there is a problem, 3 quendeld does not run.

Examples:
  quendelctl status
  quendelctl status --json
  quendelctl status --prometheus >/var/lib/prometheus/node-exporter/quendeld.prom)",
       DeclareStatus},
      {"history", "Show the last collections, the newest first",
       R"(Examples:
  quendelctl history
  quendelctl history --json)",
       DeclareHistory},
      {"pause", "Have the service send nothing, also after a restart",
       R"(Examples:
  quendelctl pause)",
       DeclarePause},
      {"resume", "Have a service that was paused go on",
       R"(Examples:
  quendelctl resume)",
       DeclareResume},
  };
}

}  // namespace quendelctl
