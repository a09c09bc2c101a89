// A command that only groups others.
#include <utility>

#include "command.h"

namespace quendelctl {

Action DeclareGroup(CLI::App& group, const std::vector<Command>& commands) {
  std::vector<std::pair<CLI::App*, Action>> declared;
  for (const Command& command : commands) {
    CLI::App* subcommand = group.add_subcommand(command.name, command.summary);
    subcommand->group("Commands")->footer(command.examples);
    declared.emplace_back(subcommand, command.declare(*subcommand));
  }
  group.require_subcommand(0, 1);
  return [declared] {
    for (const auto& [subcommand, action] : declared) {
      if (subcommand->parsed()) {
        return action();
      }
    }
    throw CLI::RequiredError("A command");
  };
}

}  // namespace quendelctl
