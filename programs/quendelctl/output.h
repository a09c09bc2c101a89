// What the program writes to the standard output. Whatever does not get there throws.
#ifndef QUENDELCTL_OUTPUT_H_
#define QUENDELCTL_OUTPUT_H_

#include <json/value.h>

#include <string>
#include <string_view>
#include <vector>

#include "command.h"

namespace quendelctl {

// Prints what came of a command: one line of JSON, in ASCII, or the lines for a reader and then the
// bytes, which stay what they are unless they could act on a terminal.
void PrintResult(const Result& result, bool json);

// Prints a text of the program's own as it is.
void PrintText(std::string_view text);

// Returns the value's JSON text on one line, for a reader: characters beyond ASCII stay what they
// are.
std::string JsonForReader(const Json::Value& value);

// Returns the value's JSON text in ASCII, indented, line by line: for a reader, and JSON still
// after it was printed.
std::vector<std::string> JsonLines(const Json::Value& value);

}  // namespace quendelctl

#endif  // QUENDELCTL_OUTPUT_H_
