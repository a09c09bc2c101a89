// Running a program, for the operations of this platform themselves.
#ifndef PLATFORM_STANDALONE_RUN_PROGRAM_H_
#define PLATFORM_STANDALONE_RUN_PROGRAM_H_

#include <initializer_list>

namespace platform {

// Runs the first of these with the others as its arguments, in the way that platform/process.h
// tells. Returns its status.
int RunProgram(std::initializer_list<const char*> arguments);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_RUN_PROGRAM_H_
