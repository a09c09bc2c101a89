// What a command is, to the tables that hold the commands and to the program that runs one.
#ifndef QUENDELCTL_COMMAND_H_
#define QUENDELCTL_COMMAND_H_

#include <json/value.h>

#include <CLI/CLI.hpp>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace quendelctl {

// What came of a command. What made the library fail is in its log lines.
struct Result {
  bool success = false;
  std::string reason = "failed";            // why not, in a word for programs
  Json::Value members = Json::objectValue;  // printed with --json, together with "success"
  std::vector<std::string> lines;           // printed without; may hold any bytes
  std::string text;                         // of the program's own, printed in either form
  std::string bytes;                        // likewise, but as they are, to anything but a terminal
  std::optional<int> exit_status = {};      // when it is not 0 for success and 1 for failure
  bool keeps_process = false;               // once it is printed, until a signal ends the process
};

using Action = std::function<Result()>;

struct Command {
  const char* name;
  const char* summary;   // one line, for the list of commands
  const char* examples;  // the end of the command's own help text

  // Declares the command's arguments. The action runs once they are read; it may still throw a
  // CLI::ParseError, as long as it has not done anything.
  Action (*declare)(CLI::App& command);
};

// Adds a command below another one, or below the program, without its arguments.
CLI::App* AddCommand(CLI::App& parent, const Command& command);

// Declares the commands of a group, which does nothing itself. Returns what runs the one that was
// given.
Action DeclareGroup(CLI::App& group, const std::vector<Command>& commands);

// The families of commands.
std::vector<Command> CollectionCommands();
std::vector<Command> CollectorCommands();
std::vector<Command> ConversationCommands();
std::vector<Command> DaemonCommands();
std::vector<Command> DeviceCommands();
std::vector<Command> PerformanceCommands();
std::vector<Command> RemoteCommands();
std::vector<Command> ShmCommands();
std::vector<Command> UploadCommands();

}  // namespace quendelctl

#endif  // QUENDELCTL_COMMAND_H_
