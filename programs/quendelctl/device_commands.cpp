// The commands that tell about the device, the way to the server, and the program.
#include <ctime>
#include <memory>

#include "command.h"
#include "hindrances.h"
#include "job.h"
#include "limit_options.h"
#include "output.h"
#include "quendel.h"

namespace quendelctl {
namespace {

Result ShowServer() {
  Result result;
  result.success = true;
  result.members["host"] = QUENDELGetServerHost();
  result.members["url"] = QUENDELGenerateReq({});
  result.lines = {QUENDELGetServerHost()};
  return result;
}

Result TestConnection() {
  Result result;
  result.success = QUENDELIsServerReachable() != 0;
  result.members["host"] = QUENDELGetServerHost();
  result.lines = {"The server " + QUENDELGetServerHost() +
                  (result.success ? " can be reached." : " cannot be reached.")};
  return result;
}

Action DeclareTestConnection(CLI::App& command) {
  const auto limits = std::make_shared<LimitArguments>();
  DeclareLimits(command, *limits, WaitFor::kAnswer);
  return
      [limits] { return RunJob(ReadLimits(*limits), "two connections in a row", TestConnection); };
}

// Adds a fact to both forms of the output. A fact that could not be found out fails the command,
// but not before the others are shown.
void AddFact(Result& result, const char* label, const char* member, bool known,
             const Json::Value& value) {
  std::string line = label;
  line.resize(17, ' ');
  if (!known) {
    line += "(unknown)";
  } else if (value.isBool()) {
    line += value.asBool() ? "yes" : "no";
  } else {
    line += value.isString() ? value.asString() : JsonForReader(value);
  }
  result.lines.push_back(line);
  result.members[member] = known ? value : Json::Value();
  if (!known) {
    result.success = false;
    result.members["error"] = "Not every fact could be found out.";
  }
}

Result ShowFacts() {
  char model[64] = "";
  char version[256] = "";
  char localTime[32] = "";
  QUENDELConf_t conf;
  const bool hasModel = QUENDELGetHMXModel(model, sizeof(model)) == 0;
  const bool hasVersion = QUENDELGetHMXVersion(version, sizeof(version)) == 0;
  const bool hasTime = QUENDELGetLocalTime(localTime, sizeof(localTime), time(nullptr)) > 0;
  const bool hasConf = QUENDELGetConf(&conf) == 0;

  Result result;
  result.success = true;
  AddFact(result, "Model:", "model", hasModel, model);
  AddFact(result, "Version:", "version", hasVersion, version);
  AddFact(result, "Local time:", "local_time", hasTime, localTime);
  AddFact(result, "Service enabled:", "service_enabled", true, QUENDELIsEnable() != 0);
  AddFact(result, "Server host:", "server_host", true, QUENDELGetServerHost());
  AddFact(result, "Contact:", "contact", hasConf, conf.contact);
  result.members["warnings"] = Json::arrayValue;
  for (const std::string& warning : FindHindrances()) {
    result.lines.push_back("Warning: " + warning);
    result.members["warnings"].append(warning);
  }
  return result;
}

Result ShowVersion() {
  Result result;
  result.success = true;
  result.members["version"] = QUENDEL_VERSION;
  result.lines = {QUENDEL_VERSION};
  return result;
}

template <Result (*kRun)()>
Action WithoutArguments(CLI::App& /*command*/) {
  return kRun;
}

}  // namespace

std::vector<Command> DeviceCommands() {
  return {
      {"server", "Show the host name of the service's server",
       R"(Examples:
  quendelctl server
  quendelctl server --json)",
       WithoutArguments<ShowServer>},
      {"test-connection", "Find out whether the server can be reached",
       R"(Takes one to five seconds, and longer where a firewall swallows the attempts.

Example:
  quendelctl test-connection && echo reachable)",
       DeclareTestConnection},
      {"facts", "Show the device's model, version, time and settings of the service",
       R"(Examples:
  quendelctl facts
  quendelctl facts --json)",
       WithoutArguments<ShowFacts>},
      {"version", "Show the version of libquendel",
       R"(Examples:
  quendelctl version
  quendelctl version --json)",
       WithoutArguments<ShowVersion>},
  };
}

}  // namespace quendelctl
