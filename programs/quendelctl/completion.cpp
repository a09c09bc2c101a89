// What completes the program's commands in a shell.
#include "completion.h"

#include <vector>

#include "command_line.h"

namespace quendelctl {
namespace {

struct Word {
  std::string word;
  std::string description;
};

// What can follow the words of one command.
struct Place {
  std::string path;  // "conf reset"; empty for the program itself
  std::vector<Word> commands;
  std::vector<Word> options;
  std::vector<std::string> values;        // of its arguments
  bool files = false;                     // whether an argument is a file
  std::vector<std::string> valueOptions;  // options that are followed by a value
  std::vector<std::string> fileOptions;   // those of them that take a file
};

std::string FirstLine(const std::string& text) {
  return text.substr(0, text.find('\n'));
}

// What stands between braces in the name of an argument's type, separated by commas.
std::vector<std::string> ValuesOf(const CLI::Option& option) {
  const std::string type = option.get_type_name();
  const size_t begin = type.find('{');
  const size_t end = type.find('}');
  return begin == type.npos || end == type.npos
             ? std::vector<std::string>()
             : CLI::detail::split(type.substr(begin + 1, end - begin - 1), ',');
}

bool IsFile(const std::string& name) {
  return name.find("FILE") != name.npos || name == "DIR" || name == "ARCHIVE";
}

void AddOption(const CLI::Option& option, Place& place) {
  if (option.get_positional()) {
    place.files = place.files || IsFile(option.get_name());
    for (const std::string& value : ValuesOf(option)) {
      place.values.push_back(value);
    }
    return;
  }
  const std::string name = "--" + option.get_lnames().at(0);
  place.options.push_back({name, FirstLine(option.get_description())});
  if (option.get_items_expected_max() > 0) {
    place.valueOptions.push_back(name);
    if (IsFile(option.get_type_name())) {
      place.fileOptions.push_back(name);
    }
  }
}

// NOLINTNEXTLINE(misc-no-recursion): commands are two deep.
void AddPlaces(const CLI::App& command, const std::string& path, std::vector<Place>& places) {
  Place place;
  place.path = path;
  for (const CLI::App* inner : CommandsOf(command)) {
    place.commands.push_back({inner->get_name(), inner->get_description()});
  }
  for (const CLI::Option* option : command.get_options()) {
    AddOption(*option, place);
  }
  places.push_back(place);
  for (const CLI::App* inner : CommandsOf(command)) {
    AddPlaces(*inner, path + (path.empty() ? "" : " ") + inner->get_name(), places);
  }
}

// Quoted for a shell.
std::string Quoted(const std::string& text) {
  std::string quoted = "'";
  for (const char c : text) {
    quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  }
  return quoted + "'";
}

std::string Names(const std::vector<Word>& words) {
  std::string names;
  for (const Word& word : words) {
    names += (names.empty() ? "" : " ") + word.word;
  }
  return names;
}

// For zsh: each with its description.
std::string Described(const std::vector<Word>& words) {
  std::string list;
  for (const Word& word : words) {
    list += (list.empty() ? "" : " ") + Quoted(word.word + ":" + word.description);
  }
  return list;
}

// The lines of a case statement that finds the command from the words before the cursor.
std::string Paths(const std::vector<Place>& places, const char* variable) {
  std::string lines;
  for (const Place& place : places) {
    if (!place.path.empty()) {
      lines += "      " + Quoted(place.path) + ") " + variable + "=" + Quoted(place.path) + " ;;\n";
    }
  }
  return lines;
}

std::string BashScript(const std::vector<Place>& places) {
  std::string table;
  for (const Place& place : places) {
    table +=
        "    " + Quoted(place.path) + ")\n      commands=" +
        Quoted(Names(place.commands) + " " + CLI::detail::join(place.values, " ")) +
        "\n      options=" + Quoted(Names(place.options)) +
        "\n      values=" + Quoted(" " + CLI::detail::join(place.valueOptions, " ") + " ") +
        "\n      file_values=" + Quoted(" " + CLI::detail::join(place.fileOptions, " ") + " ") +
        "\n      files=" + (place.files ? "1" : "''") + " ;;\n";
  }
  return R"(# Completes the commands of quendelctl in bash.
_quendelctl() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
  local place='' commands='' options='' values='' file_values='' files='' i
  for ((i = 1; i < COMP_CWORD; ++i)); do
    case "${place:+$place }${COMP_WORDS[i]}" in
)" + Paths(places, "place") +
         R"(    esac
  done
  case $place in
)" + table +
         R"(  esac
  COMPREPLY=()
  if [[ $values == *" $previous "* ]]; then
    commands='' options='' files=''
    if [[ $file_values == *" $previous "* ]]; then files=1; fi
  elif [[ $current != -* ]]; then
    options=''
  else
    commands='' files=''
  fi
  mapfile -t COMPREPLY < <(compgen -W "$commands $options" -- "$current")
  if [[ -n $files ]]; then
    mapfile -t -O "${#COMPREPLY[@]}" COMPREPLY < <(compgen -f -- "$current")
    compopt -o filenames 2>/dev/null
  fi
}
complete -F _quendelctl quendelctl
)";
}

std::string ZshScript(const std::vector<Place>& places) {
  std::string table;
  for (const Place& place : places) {
    std::string values;
    for (const std::string& value : place.values) {
      values += " " + Quoted(value);
    }
    table += "    " + Quoted(place.path) + ")\n      commands=(" + Described(place.commands) +
             values + ")\n      options=(" + Described(place.options) + ")\n      values=(" +
             CLI::detail::join(place.valueOptions, " ") + ")\n      file_values=(" +
             CLI::detail::join(place.fileOptions, " ") +
             ")\n      files=" + (place.files ? "1" : "0") + " ;;\n";
  }
  return R"(#compdef quendelctl
# Completes the commands of quendelctl in zsh.
_quendelctl() {
  local place='' word
  local -a commands options values file_values
  local -i files=0
  for word in "${(@)words[2,CURRENT-1]}"; do
    case "${place:+$place }$word" in
)" + Paths(places, "place") +
         R"(    esac
  done
  case $place in
)" + table +
         R"(  esac
  if (( ${values[(Ie)$words[CURRENT-1]]} )); then
    if (( ${file_values[(Ie)$words[CURRENT-1]]} )); then _files; fi
  elif [[ $words[CURRENT] == -* ]]; then
    _describe -o option options
  else
    (( $#commands )) && _describe command commands
    (( files )) && _files
  fi
}
compdef _quendelctl quendelctl
)";
}

}  // namespace

std::string CompletionScript(const CLI::App& app, const std::string& shell) {
  std::vector<Place> places;
  AddPlaces(app, "", places);
  return shell == "bash" ? BashScript(places) : ZshScript(places);
}

}  // namespace quendelctl
