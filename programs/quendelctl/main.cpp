// quendelctl: the remote support service from the command line.
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>
#include <sstream>

#include "command_line.h"
#include "output.h"
#include "safe_stderr.h"

namespace quendelctl {
namespace {

constexpr int kExitSuccess = 0;
constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;

// Prints what the parser has to say: the help or the version that was asked for, else a complaint.
int AnswerParser(const CLI::App& app, const CLI::ParseError& error) {
  std::ostringstream out;
  std::ostringstream complaint;
  if (app.exit(error, out, complaint) == 0) {
    PrintText(out.str());
    return kExitSuccess;
  }
  const std::string hint = Hint(app, error);
  Complain(error.what());
  if (!hint.empty()) {
    Tell(hint);
  }
  Tell("Run with --help for more information.");
  return kExitUsage;
}

int Run(int argc, char** argv) {
  CommandLine commandLine;
  CLI::App& app = commandLine.app;
  try {
    app.parse(argc, argv);
    if (!commandLine.action) {
      throw CLI::RequiredError("A command");
    }
    const Result result = commandLine.action();
    PrintResult(result, commandLine.json);
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
    quendelctl::Complain(error.what());
    return quendelctl::kExitFailed;
  }
}
