// The commands beside serving: looking into the desk's folder and changing what is in it.
#ifndef QUENDEL_DESK_COMMANDS_H_
#define QUENDEL_DESK_COMMANDS_H_

#include <CLI/CLI.hpp>
#include <functional>
#include <string>

namespace quendeldesk {

// What the command line chose. Returns the program's exit status.
using Command = std::function<int()>;

// Declares the commands. `folder` is read when the chosen one runs.
void DeclareCommands(CLI::App& app, const std::string& folder, Command& chosen);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_COMMANDS_H_
