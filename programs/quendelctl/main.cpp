// quendelctl: the remote support service from the command line.
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <sstream>

#include "command.h"
#include "output.h"
#include "quendel.h"
#include "safe_stderr.h"

namespace quendelctl {
namespace {

constexpr int kExitSuccess = 0;
constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;

constexpr char kDescription[] =
    "quendelctl - the remote support service of this device, from the command line";
constexpr char kFooter[] =
    R"(Run "quendelctl COMMAND --help" for a command's arguments and examples.

Exit status: 0 success, 1 the operation failed, 2 the command line is wrong.
The reasons of a failure go to the standard error output and to the system's log.)";

constexpr std::vector<Command> (*kFamilies[])() = {
    ConversationCommands, CollectionCommands, PerformanceCommands,
    CollectorCommands,    UploadCommands,     RemoteCommands,
    ShmCommands,          DeviceCommands,     DaemonCommands};

// What the command line asked for.
struct Request {
  Action action;
  bool json = false;
};

// An empty value comes from a variable that was not set. It must not pass for one that was not
// given. What stands without an option's name has to be there, and says itself what it must be.
void RefuseEmptyValues(CLI::App& command) {
  for (CLI::Option* option : command.get_options()) {
    if (!option->get_positional()) {
      option->check([](const std::string& value) {
        return value.empty() ? std::string("must not be empty") : std::string();
      });
    }
  }
}

// Returns the commands that do something: one that has commands of its own leaves that to them.
std::vector<CLI::App*> Doers(CLI::App& command) {
  std::vector<CLI::App*> doers = command.get_subcommands([](CLI::App*) { return true; });
  return doers.empty() ? std::vector<CLI::App*>{&command} : doers;
}

void DeclareCommand(CLI::App& app, const Command& command, Request& request) {
  CLI::App* subcommand = AddCommand(app, command);
  Action action = command.declare(*subcommand);
  for (CLI::App* doer : Doers(*subcommand)) {
    doer->add_flag("--json", request.json, "Print one line of JSON instead of text");
    RefuseEmptyValues(*doer);
  }
  subcommand->callback([action, &request] { request.action = action; });
}

void DeclareCommandLine(CLI::App& app, Request& request) {
  app.footer(kFooter);
  app.get_formatter()->label("SUBCOMMAND", "COMMAND");
  app.get_formatter()->column_width(20);
  app.set_version_flag("--version", "quendelctl " QUENDEL_VERSION, "Print the version and exit");
  app.require_subcommand(0, 1);
  for (const auto& family : kFamilies) {
    for (const Command& command : family()) {
      DeclareCommand(app, command, request);
    }
  }
}

// Prints what the parser has to say: the help or the version that was asked for, else a complaint.
int AnswerParser(const CLI::App& app, const CLI::ParseError& error) {
  std::ostringstream out;
  std::ostringstream complaint;
  const int code = app.exit(error, out, complaint);
  if (code != 0) {
    fprintf(stderr, "quendelctl: %s", complaint.str().c_str());
  }
  PrintText(out.str());
  return code == 0 ? kExitSuccess : kExitUsage;
}

int Run(int argc, char** argv) {
  CLI::App app(kDescription, "quendelctl");
  Request request;
  DeclareCommandLine(app, request);
  try {
    app.parse(argc, argv);
    if (!request.action) {
      throw CLI::RequiredError("A command");
    }
    const Result result = request.action();
    PrintResult(result, request.json);
    if (result.keeps_process) {
      close(STDOUT_FILENO);  // its reader need not wait for the process
      for (;;) {
        pause();
      }
    }
    return result.exit_status.value_or(result.success ? kExitSuccess : kExitFailed);
  } catch (const CLI::ParseError& error) {
    return AnswerParser(app, error);
  }
}

// A standard descriptor that is closed would be given to the next file or connection that is
// opened, and output would end up in it. Each gets one that cannot be used for what it is there
// for.
void OccupyStandardDescriptors() {
  struct stat status;
  for (const int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fstat(descriptor, &status) != 0) {
      open("/dev/null", descriptor == STDIN_FILENO ? O_WRONLY : O_RDONLY);
    }
  }
}

}  // namespace
}  // namespace quendelctl

int main(int argc, char** argv) {
  quendelctl::OccupyStandardDescriptors();
  signal(SIGPIPE, SIG_IGN);  // a reader that has gone is an error like a full disk
  const quendelctl::SafeStderr safeStderr;
  if (!safeStderr.works()) {
    return quendelctl::kExitFailed;
  }
  openlog("quendelctl", LOG_PERROR, LOG_USER);
  try {
    return quendelctl::Run(argc, argv);
  } catch (const std::exception& error) {
    fprintf(stderr, "quendelctl: %s\n", error.what());
    return quendelctl::kExitFailed;
  }
}
