// The library's log line.
//
// A unit that logs has a `kLogUnit` in scope: its name, as it stands in front of each of its lines.
// The pieces are pasted at compile time, so the compiler checks the arguments, %m still sees errno,
// and no message is cut to a buffer.
#ifndef BASE_LOG_H_
#define BASE_LOG_H_

#include <syslog.h>

#define QUENDEL_LOG(format, ...) syslog(LOG_ERR, "%s:%d " format, kLogUnit, __LINE__, ##__VA_ARGS__)

#endif  // BASE_LOG_H_
