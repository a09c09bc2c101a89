// The library's log line.
//
// A unit that logs has a `kLogUnit` in scope: its name, as it stands in front of each of its lines.
// The pieces are pasted at compile time, so the compiler checks the arguments, %m still sees errno,
// and no message is cut to a buffer. One that is too long for the system's log, which would drop it
// whole, has its long texts shortened: what a hostile server sends must not hide what became of it.
#ifndef BASE_LOG_H_
#define BASE_LOG_H_

#include <syslog.h>

// The first branch is never taken: the compiler checks the arguments against it.
#define QUENDEL_LOG(format, ...)                                               \
  (false ? syslog(LOG_ERR, "%s:%d " format, kLogUnit, __LINE__, ##__VA_ARGS__) \
         : ::quendel::WriteLog("%s:%d " format, kLogUnit, __LINE__, ##__VA_ARGS__))

namespace quendel {

// Room for the format of a message that is shortened.
constexpr int kLogFormatBytes = 512;

// Returns the format itself when the system's log takes the message, else, in `shortened`, one for
// the same arguments that cuts long texts and marks them with "...". Conversions are %s, %d, %ld,
// %m and %.*s, which keeps its length. Allocates nothing, and leaves errno as it was.
const char* LogFormat(char (&shortened)[kLogFormatBytes], const char* format, ...);

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
template <typename... Arguments>
void WriteLog(const char* format, Arguments... arguments) {
  char shortened[kLogFormatBytes];
  syslog(LOG_ERR, LogFormat(shortened, format, arguments...), arguments...);
}
#pragma GCC diagnostic pop

}  // namespace quendel

#endif  // BASE_LOG_H_
