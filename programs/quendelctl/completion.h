// What completes the program's commands in a shell.
#ifndef QUENDELCTL_COMPLETION_H_
#define QUENDELCTL_COMPLETION_H_

#include <CLI/CLI.hpp>
#include <string>

namespace quendelctl {

// Returns the script that completes the commands and options of `app` in "bash" or "zsh".
std::string CompletionScript(const CLI::App& app, const std::string& shell);

}  // namespace quendelctl

#endif  // QUENDELCTL_COMPLETION_H_
