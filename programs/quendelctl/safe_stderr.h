// The standard error output, made safe to show on a terminal.
#ifndef QUENDELCTL_SAFE_STDERR_H_
#define QUENDELCTL_SAFE_STDERR_H_

#include <sys/types.h>

#include <string>

namespace quendelctl {

// While one of these lives, what is written to the standard error output passes through a process
// that escapes whatever could act on a terminal. The library's log lines quote the server's replies
// as they came, and syslog() prints them without a look at them.
//
// It is a socket that keeps apart what each call writes, for syslog() writes a line by one call: a
// line end within that was quoted, and is escaped as well. So whoever writes several lines of this
// program's own writes them one by one.
class SafeStderr {
 public:
  // Says so when the system has no descriptor or process left, and then changes nothing.
  SafeStderr();
  bool works() const { return filter_ > 0; }
  // Returns once everything has been shown.
  ~SafeStderr();
  SafeStderr(const SafeStderr&) = delete;
  SafeStderr& operator=(const SafeStderr&) = delete;

 private:
  void Start(int readEnd, int writeEnd);

  int original_ = -1;
  pid_t filter_ = -1;
};

// Writes a complaint of this program's own: one line, with the program's name before it.
void Complain(const std::string& line);

// Writes a line without the name.
void Tell(const std::string& line);

// Returns the descriptor of the standard error output itself, for what this program draws on a
// terminal. Nothing from elsewhere may be written there.
int RawStderr();

// Tells whether this is a terminal on which a line can be taken back and written again.
bool CanRedraw(int descriptor);

}  // namespace quendelctl

#endif  // QUENDELCTL_SAFE_STDERR_H_
