// What the library logged.
#include "support/log.h"

#include <syslog.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>

#include "support/journal.h"
#include "support/own_work.h"
#include "support/require.h"

namespace quendel::test {
namespace {

Journal& Lines() {
  static Journal lines;
  return lines;
}

// Before main(), so that forked children find it there.
[[maybe_unused]] const Journal& earlyLines = Lines();

// Each text starts with the priority and a blank.
void Capture(int priority, const char* format, va_list arguments) {
  const OwnWork ownWork;
  const int savedErrno = errno;
  va_list again;
  va_copy(again, arguments);
  const int length = vsnprintf(nullptr, 0, format, again);
  va_end(again);
  Require(length >= 0, std::string("a log line cannot be formatted: ") + format);
  std::string text(static_cast<size_t>(length) + 1, '\0');
  errno = savedErrno;  // for %m
  vsnprintf(text.data(), text.size(), format, arguments);
  text.pop_back();
  Lines().Add(std::to_string(priority) + " " + text);
  errno = savedErrno;
}

LogLine LineFrom(const std::string& captured) {
  LogLine line;
  size_t start = 0;
  line.priority = std::stoi(captured, &start);
  const std::string text = captured.substr(start + 1);
  const size_t colon = text.find(':');
  const size_t digits = colon == std::string::npos ? colon : colon + 1;
  const size_t blank = text.find_first_not_of("0123456789", digits);
  if (blank == std::string::npos || blank == digits || text[blank] != ' ') {
    line.message = text;
    return line;
  }
  line.unit = text.substr(0, colon);
  line.line = std::stoi(text.substr(digits));
  line.message = text.substr(blank + 1);
  return line;
}

}  // namespace

std::vector<LogLine> Log() {
  std::vector<LogLine> lines;
  for (const std::string& captured : Lines().Texts()) {
    lines.push_back(LineFrom(captured));
  }
  return lines;
}

void ClearLog() {
  Lines().Clear();
}

void PrintTo(const LogLine& line, std::ostream* out) {
  *out << "[" << line.unit << ":" << line.line << "] " << line.message;
  if (line.priority != LOG_ERR) {
    *out << " (priority " << line.priority << ")";
  }
}

testing::Matcher<LogLine> Logged(const testing::Matcher<std::string>& unit,
                                 const testing::Matcher<std::string>& message) {
  return testing::AllOf(testing::Field("unit", &LogLine::unit, unit),
                        testing::Field("message", &LogLine::message, message),
                        testing::Field("priority", &LogLine::priority, LOG_ERR));
}

}  // namespace quendel::test

// glibc's four doors to the log; the ones with `flag` are what an optimising compiler calls.
extern "C" {

void __wrap_vsyslog(int priority, const char* format, va_list arguments) {
  quendel::test::Capture(priority, format, arguments);
}

void __wrap___vsyslog_chk(int priority, int /*flag*/, const char* format, va_list arguments) {
  quendel::test::Capture(priority, format, arguments);
}

void __wrap_syslog(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  quendel::test::Capture(priority, format, arguments);
  va_end(arguments);
}

void __wrap___syslog_chk(int priority, int /*flag*/, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  quendel::test::Capture(priority, format, arguments);
  va_end(arguments);
}
}
