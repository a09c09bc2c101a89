// What the library logged: each syslog call of the test program and of the children it forks lands
// here instead of in the system's log.
#ifndef TESTS_SUPPORT_LOG_H_
#define TESTS_SUPPORT_LOG_H_

#include <gmock/gmock.h>

#include <ostream>
#include <string>
#include <vector>

namespace quendel::test {

// One call. A line that does not read as "<unit>:<line> <message>" is all message, without a unit.
struct LogLine {
  std::string unit;
  int line = 0;
  std::string message;
  int priority = 0;
};

void PrintTo(const LogLine& line, std::ostream* out);

// Returns everything logged since the program's start or the last ClearLog(), in order.
std::vector<LogLine> Log();

void ClearLog();

// Matches a line of LOG_ERR by its unit and its message, not by its line number:
//   EXPECT_THAT(Log(), ElementsAre(Logged("quendel_heartbeat", "Failed to get serial number")));
// Both may be matchers.
testing::Matcher<LogLine> Logged(const testing::Matcher<std::string>& unit,
                                 const testing::Matcher<std::string>& message);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_LOG_H_
