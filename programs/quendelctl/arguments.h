// Readers for the arguments that several commands share.
#ifndef QUENDELCTL_ARGUMENTS_H_
#define QUENDELCTL_ARGUMENTS_H_

#include <json/value.h>

#include <cstdint>
#include <string>

namespace quendelctl {

// Each of these throws a CLI::ValidationError, which names the argument, for a text it cannot read.

// Reads a whole number in decimal, with nothing around it.
int ReadNumber(const std::string& argument, const std::string& text);

// Reads a moment: seconds since the epoch in decimal, not negative, with nothing around them.
int64_t ReadMoment(const std::string& argument, const std::string& text);

// Reads the whole of a file, "-" for the standard input, if it is not longer than that.
std::string ReadText(const std::string& argument, const std::string& name, size_t mostBytes);

// Reads a JSON value from what the user gave: an object's JSON text, which begins with "{", or else
// the name of a file that holds JSON of any kind, "-" for the standard input.
Json::Value ReadJson(const std::string& argument, const std::string& text);

}  // namespace quendelctl

#endif  // QUENDELCTL_ARGUMENTS_H_
