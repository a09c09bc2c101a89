// A program that runs, and how it ends.
#ifndef PLATFORM_STANDALONE_STARTED_PROGRAM_H_
#define PLATFORM_STANDALONE_STARTED_PROGRAM_H_

#include <sys/types.h>

#include <vector>

#include "base/owned_fd.h"

namespace platform {

// Either a child of this process, or one of a helper that reports how it ended.
struct StartedProgram {
  pid_t child = -1;
  quendel::OwnedFd report = quendel::OwnedFd();

  explicit operator bool() const { return child >= 0 || report; }
};

// Starts a program in the way that platform/process.h tells. `argv` ends with a null pointer;
// `output` is what the program gets as its standard output, /dev/null when negative. Returns no
// program, with errno and the last error set, when it could not be started.
StartedProgram StartProgram(const std::vector<char*>& argv, int output);

// Waits for a program's end. Returns its status, or -1 with errno and the last error set when that
// is lost.
int WaitForStatus(const StartedProgram& program);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_STARTED_PROGRAM_H_
