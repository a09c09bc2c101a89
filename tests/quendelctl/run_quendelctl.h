// Runs the real quendelctl and keeps what it printed.
#ifndef TESTS_QUENDELCTL_RUN_QUENDELCTL_H_
#define TESTS_QUENDELCTL_RUN_QUENDELCTL_H_

#include <json/value.h>

#include <functional>
#include <string>
#include <vector>

namespace quendel::test {

struct Output {
  int status;       // the exit status; 128 + signal when a signal ended it
  std::string out;  // the standard output
  std::string err;  // the standard error output
};

// Runs quendelctl with the arguments and with `input` as its standard input.
Output Quendelctl(const std::vector<std::string>& arguments, const std::string& input = "");

// Runs a shell command that finds the program as $quendelctl.
Output Shell(const std::string& command);

// What a terminal of this width shows while quendelctl runs on it. `type` may write to it
// meanwhile.
struct Terminal {
  int status = -1;
  std::string shown;
};
Terminal OnTerminal(const std::vector<std::string>& arguments, unsigned short columns = 80,
                    const char* kind = "xterm", const std::function<void(int)>& type = nullptr);

// Reads a line that must be one JSON object in ASCII with a line end.
Json::Value FromJsonLine(const std::string& line);

}  // namespace quendel::test

#endif  // TESTS_QUENDELCTL_RUN_QUENDELCTL_H_
