// The commands that speak with the server: heartbeat, event and progress.
#include <iterator>
#include <memory>

#include "arguments.h"
#include "command.h"
#include "daemon_commands.h"
#include "job.h"
#include "limit_options.h"
#include "output.h"
#include "quendel.h"

namespace quendelctl {
namespace {

constexpr char kServersAnswer[] = "the server's answer";

std::vector<std::string> DescribeActions(const Json::Value& actions) {
  if (actions.empty()) {  // null, or an array or object that holds nothing
    return {"The server has queued no actions."};
  }
  if (!actions.isArray()) {
    return {"The server has queued: " + JsonForReader(actions)};
  }
  std::vector<std::string> lines = {"The server has queued " + std::to_string(actions.size()) +
                                    (actions.size() == 1 ? " action:" : " actions:")};
  for (const Json::Value& action : actions) {
    lines.push_back("  " + JsonForReader(action));
  }
  return lines;
}

Result SendHeartbeat() {
  Result result;
  Json::Value actions;
  if (QUENDELHeartbeat(actions) < 0) {
    result.lines = {"The heartbeat failed."};
    return result;
  }
  result.success = true;
  result.lines = DescribeActions(actions);
  result.members["actions"] = actions;
  return result;
}

Action DeclareHeartbeat(CLI::App& command) {
  const auto now = std::make_shared<bool>(false);
  const auto limits = std::make_shared<LimitArguments>();
  command.add_flag("--now", *now, "Have quendeld send its next one now, and act on what it gets");
  DeclareLimits(command, *limits, WaitFor::kAnswer);
  return [now, limits] {
    return *now ? HaveDaemonBeat() : RunJob(ReadLimits(*limits), kServersAnswer, SendHeartbeat);
  };
}

struct EventArguments {
  std::string name;
  std::string info;
  LimitArguments limits;
};

// The command line has let only names of the table through.
QuendelEvent_t EventByName(const std::string& name) {
  int event = 0;
  while (name != QUENDEL_ACTION_NAMES[event]) {
    ++event;
  }
  return static_cast<QuendelEvent_t>(event);
}

Json::Value ReadInfo(const EventArguments& arguments) {
  if (arguments.info.empty()) {
    return Json::objectValue;
  }
  if (EventByName(arguments.name) != QUENDEL_EVENT_ENABLE) {
    throw CLI::ValidationError("--info", "goes with the event enable only");
  }
  return ReadJson("--info", arguments.info);
}

Result SendEvent(const std::string& name, const Json::Value& info) {
  Result result;
  Json::Value reply;
  result.success = QUENDELPostEventToServer(EventByName(name), reply, info) == 0;
  result.lines = {result.success ? "The server accepted the event " + name + "."
                                 : "The event " + name + " was not accepted."};
  if (!result.success && !reply.isNull()) {
    result.lines.push_back("The server answered: " + JsonForReader(reply));
  }
  result.members["event"] = name;
  result.members["reply"] = reply;
  return result;
}

Result ReportEvent(const EventArguments& arguments) {
  const Json::Value info = ReadInfo(arguments);
  if (EventByName(arguments.name) == QUENDEL_EVENT_LOGOUT) {
    if (const std::optional<Result> told = HaveDaemonSendLogout()) {
      return *told;
    }
  }
  return RunJob(ReadLimits(arguments.limits), kServersAnswer,
                [&] { return SendEvent(arguments.name, info); });
}

Action DeclareEvent(CLI::App& command) {
  const auto arguments = std::make_shared<EventArguments>();
  command.add_option("NAME", arguments->name, "What happened")
      ->required()
      ->type_name("")
      ->check(CLI::IsMember(std::vector<std::string>(std::begin(QUENDEL_ACTION_NAMES),
                                                     std::end(QUENDEL_ACTION_NAMES))));
  command
      .add_option("--info", arguments->info,
                  "Description of the device, for the event enable only: a JSON\n"
                  "object, or a file that holds JSON (- is the standard input)")
      ->type_name("FILE|JSON");
  DeclareLimits(command, arguments->limits, WaitFor::kAnswer);
  return [arguments] { return ReportEvent(*arguments); };
}

struct ProgressWord {
  const char* word;
  QuendelActionProgress_t value;
};

constexpr ProgressWord kProgressWords[] = {{"run", QUENDEL_ACT_PROGRESS_RUN},
                                           {"done", QUENDEL_ACT_PROGRESS_DONE},
                                           {"failed", QUENDEL_ACT_PROGRESS_FAILED},
                                           {"no-file", QUENDEL_ACT_PROGRESS_NO_FILE}};

struct ProgressArguments {
  std::string id;
  std::string value;
  std::string details;
  LimitArguments limits;
};

const ProgressWord& ReadProgress(const std::string& text) {
  for (const ProgressWord& row : kProgressWords) {
    if (text == row.word || text == std::to_string(row.value)) {
      return row;
    }
  }
  throw CLI::ValidationError("VALUE",
                             text + " is none of run, done, failed, no-file, 1, 0, -1, -3");
}

Result SendProgress(int id, const ProgressWord& progress, const Json::Value& details) {
  Result result;
  result.success = QUENDELUpdateActRequestProgress(id, progress.value, details) == 0;
  const std::string report = "report on request " + std::to_string(id) + ": " + progress.word + ".";
  result.lines = {result.success ? "The server accepted the " + report
                                 : "The server did not get or accept the " + report};
  result.members["request_id"] = id;
  result.members["progress"] = progress.value;
  return result;
}

Result ReportProgress(const ProgressArguments& arguments) {
  const int id = ReadNumber("ID", arguments.id);
  const ProgressWord& progress = ReadProgress(arguments.value);
  const Json::Value details = arguments.details.empty() ? Json::Value(Json::objectValue)
                                                        : ReadJson("--details", arguments.details);
  return RunJob(ReadLimits(arguments.limits), kServersAnswer,
                [&] { return SendProgress(id, progress, details); });
}

Action DeclareProgress(CLI::App& command) {
  const auto arguments = std::make_shared<ProgressArguments>();
  command.add_option("ID", arguments->id, "Number that the server gave the request")
      ->required()
      ->type_name("");
  command
      .add_option("VALUE", arguments->value,
                  "How it stands: run (1), done (0), failed (-1) or no-file (-3)")
      ->required()
      ->type_name("");
  command
      .add_option("--details", arguments->details,
                  "What to send with it: a JSON object, or a file that holds JSON\n"
                  "(- is the standard input); an empty object if not given")
      ->type_name("FILE|JSON");
  DeclareLimits(command, arguments->limits, WaitFor::kAnswer);
  return [arguments] { return ReportProgress(*arguments); };
}

}  // namespace

std::vector<Command> ConversationCommands() {
  return {
      {"heartbeat", "Tell the server that the device is alive and show the actions it queued",
       R"(Examples:
  quendelctl heartbeat
  quendelctl heartbeat --json)",
       DeclareHeartbeat},
      {"event", "Report an event of the device to the server",
       R"(Examples:
  quendelctl event reboot
  quendelctl event enable --info '{"model": "X"}'
  quendelctl event enable --info device.json)",
       DeclareEvent},
      {"progress", "Tell the server how an action stands that it requested",
       R"(Examples:
  quendelctl progress 17 done
  quendelctl progress 17 -3
  quendelctl progress 17 failed --details '{"reason": "disk full"}')",
       DeclareProgress},
  };
}

}  // namespace quendelctl
