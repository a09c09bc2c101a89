// How long a command may take, and how much memory: its options and the settings file.
#ifndef QUENDELCTL_LIMIT_OPTIONS_H_
#define QUENDELCTL_LIMIT_OPTIONS_H_

#include <CLI/CLI.hpp>
#include <string>

#include "worker.h"

namespace quendelctl {

// What a command waits for: an answer, or files on their way.
enum class WaitFor { kAnswer, kTransfer };

// What the options of a command said.
struct LimitArguments {
  WaitFor wait_for = WaitFor::kAnswer;
  std::string timeout;
  std::string memory;
};

// Declares the options --timeout and --memory.
void DeclareLimits(CLI::App& command, LimitArguments& arguments, WaitFor waitFor);

// Returns the limits that the options give, or else the settings file, or else the program. A value
// in the file that is none is complained about and not used. Throws a CLI::ValidationError for an
// option's.
WorkerLimits ReadLimits(const LimitArguments& arguments);

}  // namespace quendelctl

#endif  // QUENDELCTL_LIMIT_OPTIONS_H_
