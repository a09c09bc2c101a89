// The command line as a whole: the program's commands and options.
#ifndef QUENDELCTL_COMMAND_LINE_H_
#define QUENDELCTL_COMMAND_LINE_H_

#include <CLI/CLI.hpp>
#include <string>

#include "command.h"

namespace quendelctl {

// What can be asked for, and, once `app` has parsed it, what was.
struct CommandLine {
  CommandLine();

  CLI::App app;
  Action action;  // null when no command was given
  bool json = false;
};

// Returns what may have been meant by a word that was not understood: a sentence, or nothing.
std::string Hint(const CLI::App& app, const CLI::ParseError& error);

// Returns the commands of a command, or of the program.
std::vector<const CLI::App*> CommandsOf(const CLI::App& command);

}  // namespace quendelctl

#endif  // QUENDELCTL_COMMAND_LINE_H_
