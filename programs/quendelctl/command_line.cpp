// The command line as a whole: the program's commands and options.
#include "command_line.h"

#include <algorithm>
#include <memory>
#include <numeric>

#include "completion.h"
#include "quendel.h"

namespace quendelctl {
namespace {

constexpr char kDescription[] =
    "quendelctl - the remote support service of this device, from the command line";
constexpr char kFooter[] =
    R"(Run "quendelctl COMMAND --help" for a command's arguments and examples.

Exit status: 0 success, 1 the operation failed, 2 the command line is wrong.
The reasons of a failure go to the standard error output and to the system's log.)";
constexpr char kJson[] = "Print one line of JSON instead of text";

constexpr std::vector<Command> (*kFamilies[])() = {
    ConversationCommands, CollectionCommands, PerformanceCommands,
    CollectorCommands,    UploadCommands,     RemoteCommands,
    ShmCommands,          DeviceCommands,     DaemonCommands};

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

// Adds what every command takes, to this one and those below it.
// NOLINTNEXTLINE(misc-no-recursion): commands are two deep.
void AddCommonOptions(CLI::App& command, bool& json) {
  command.add_flag("--json", json, kJson);
  RefuseEmptyValues(command);
  for (CLI::App* inner : command.get_subcommands([](CLI::App*) { return true; })) {
    AddCommonOptions(*inner, json);
  }
}

void DeclareCommand(CommandLine& line, const Command& command) {
  CLI::App* subcommand = AddCommand(line.app, command);
  Action action = command.declare(*subcommand);
  AddCommonOptions(*subcommand, line.json);
  subcommand->callback([action, &line] { line.action = action; });
}

const CLI::App* FindCommand(const CLI::App& parent, const std::string& name) {
  for (const CLI::App* command : CommandsOf(parent)) {
    if (command->get_name() == name) {
      return command;
    }
  }
  return nullptr;
}

Result ShowHelp(const CLI::App& app, const std::vector<std::string>& words) {
  const CLI::App* command = &app;
  std::string path = app.get_name();
  for (const std::string& word : words) {
    command = FindCommand(*command, word);
    if (command == nullptr) {
      throw CLI::ValidationError("COMMAND", "there is no command " + word);
    }
    path += " " + word;
  }
  Result result;
  result.success = true;
  result.text = command->get_formatter()->make_help(command, path, CLI::AppFormatMode::Normal);
  return result;
}

void DeclareHelp(CommandLine& line) {
  const auto words = std::make_shared<std::vector<std::string>>();
  CLI::App* help = AddCommand(line.app, {"help", "Show the help of a command, or this one",
                                         "Example:\n  quendelctl help conf reset", nullptr});
  help->add_option("COMMAND", *words, "The command's words")->type_name("");
  help->callback(
      [words, &line] { line.action = [=, &line] { return ShowHelp(line.app, *words); }; });
}

void DeclareCompletion(CommandLine& line) {
  const auto shell = std::make_shared<std::string>();
  CLI::App* completion =
      AddCommand(line.app, {"completion", "Print what completes these commands in a shell",
                            R"(A shell finds what is installed by itself. For the one that runs now:

Examples:
  source <(quendelctl completion bash)
  source <(quendelctl completion zsh))",
                            nullptr});
  completion->add_option("SHELL", *shell, "The shell")
      ->required()
      ->type_name("")
      ->check(CLI::IsMember(std::vector<std::string>{"bash", "zsh"}));
  completion->callback([shell, &line] {
    line.action = [=, &line] {
      Result result;
      result.success = true;
      result.text = CompletionScript(line.app, *shell);
      return result;
    };
  });
}

// How many letters have to be added, left out, replaced or swapped with the next to make one word
// of the other.
size_t Distance(const std::string& one, const std::string& other) {
  std::vector<size_t> before;
  std::vector<size_t> last;
  std::vector<size_t> row(other.size() + 1);
  std::iota(row.begin(), row.end(), 0);
  for (size_t i = 1; i <= one.size(); ++i) {
    before = std::exchange(last, row);
    row[0] = i;
    for (size_t j = 1; j <= other.size(); ++j) {
      const size_t replaced = last[j - 1] + (one[i - 1] == other[j - 1] ? 0 : 1);
      row[j] = std::min({replaced, last[j] + 1, row[j - 1] + 1});
      if (i > 1 && j > 1 && one[i - 1] == other[j - 2] && one[i - 2] == other[j - 1]) {
        row[j] = std::min(row[j], before[j - 2] + 1);
      }
    }
  }
  return row[other.size()];
}

// Returns the word that is nearest, if one is near.
std::string Nearest(const std::string& word, const std::vector<std::string>& words) {
  constexpr size_t kNear = 2;
  std::string nearest;
  size_t least = std::min(kNear + 1, word.size());
  for (const std::string& candidate : words) {
    const bool begun = word.size() > 2 && candidate.rfind(word, 0) == 0;
    const size_t distance = begun ? 1 : Distance(word, candidate);
    if (distance < least) {
      least = distance;
      nearest = candidate;
    }
  }
  return nearest;
}

// The command that was understood last.
const CLI::App* Understood(const CLI::App* command) {
  while (!command->get_subcommands().empty()) {
    command = command->get_subcommands().front();
  }
  return command;
}

std::vector<std::string> Options(const CLI::App& command) {
  std::vector<std::string> names;
  for (const CLI::Option* option : command.get_options()) {
    for (const std::string& name : option->get_lnames()) {
      names.push_back("--" + name);
    }
  }
  return names;
}

std::vector<std::string> CommandNames(const CLI::App& command) {
  std::vector<std::string> names;
  for (const CLI::App* inner : CommandsOf(command)) {
    names.push_back(inner->get_name());
  }
  return names;
}

}  // namespace

CommandLine::CommandLine() : app(kDescription, "quendelctl") {
  app.footer(kFooter);
  app.get_formatter()->label("SUBCOMMAND", "COMMAND");
  app.get_formatter()->column_width(20);
  app.set_version_flag("-V,--version", "quendelctl " QUENDEL_VERSION, "Print the version and exit");
  app.add_flag("--json", json, kJson);
  app.require_subcommand(0, 1);
  for (const auto& family : kFamilies) {
    for (const Command& command : family()) {
      DeclareCommand(*this, command);
    }
  }
  DeclareCompletion(*this);
  DeclareHelp(*this);
}

std::string Hint(const CLI::App& app, const CLI::ParseError& error) {
  const std::vector<std::string> unknown = app.remaining(true);
  if (error.get_exit_code() != static_cast<int>(CLI::ExitCodes::ExtrasError) || unknown.empty()) {
    return "";
  }
  const CLI::App& command = *Understood(&app);
  const std::string& word = unknown.front();
  const std::string nearest =
      Nearest(word, word.rfind('-', 0) == 0 ? Options(command) : CommandNames(command));
  return nearest.empty() ? "" : "Did you mean " + nearest + "?";
}

std::vector<const CLI::App*> CommandsOf(const CLI::App& command) {
  return command.get_subcommands([](const CLI::App*) { return true; });
}

}  // namespace quendelctl
