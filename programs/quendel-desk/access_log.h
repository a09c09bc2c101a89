// One line for each request, on the standard output.
#ifndef QUENDEL_DESK_ACCESS_LOG_H_
#define QUENDEL_DESK_ACCESS_LOG_H_

#include <chrono>
#include <cstdint>
#include <string>

namespace quendeldesk {

struct AccessLine {
  std::string address;
  std::string method;
  std::string target;
  unsigned status = 0;
  int code = 0;
  uint64_t received = 0;
  std::chrono::nanoseconds duration{0};
  bool cut = false;  // ended before it was whole
  std::string note;
};

// Returns the text with what does not print replaced by \xNN, and quotes and backslashes escaped.
std::string Printable(const std::string& text);

void WriteAccessLine(const AccessLine& line);

// Writes a line about the desk itself, to the standard error output.
void LogLine(const std::string& text);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_ACCESS_LOG_H_
