// A command below another one, and a command that only groups others.
#include <utility>

#include "command.h"

namespace quendelctl {

CLI::App* AddCommand(CLI::App& parent, const Command& command) {
  CLI::App* added = parent.add_subcommand(command.name, command.summary);
  added->group("Commands")->footer(command.examples);
  return added;
}

Action DeclareGroup(CLI::App& group, const std::vector<Command>& commands) {
  std::vector<std::pair<CLI::App*, Action>> declared;
  for (const Command& command : commands) {
    CLI::App* subcommand = AddCommand(group, command);
    declared.emplace_back(subcommand, command.declare(*subcommand));
  }
  group.require_subcommand(0, 1);
  std::vector<std::string> names;
  names.reserve(commands.size());
  for (const Command& command : commands) {
    names.emplace_back(command.name);
  }
  return [declared, names, name = group.get_name()] {
    for (const auto& [subcommand, action] : declared) {
      if (subcommand->parsed()) {
        return action();
      }
    }
    throw CLI::ValidationError(
        name, "one of these commands is required: " + CLI::detail::join(names, ", "));
  };
}

}  // namespace quendelctl
