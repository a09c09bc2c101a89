// Running programs.
//
// A program gets exactly the arguments that are given; no shell is ever between. Its standard input
// and error output are /dev/null, and so is its standard output unless the caller reads it. It gets
// the caller's environment, no other descriptor of the caller, every signal at its default action
// and none blocked.
//
// A status is the program's exit status, or 128 + the number of the signal that ended it; -1 means
// that the program was never started, and errno says why. A caller that ignores SIGCHLD gets the
// status all the same, by way of a helper process, and goes on ignoring it. One that reaps the
// child itself loses the status, which gives -1 with errno ECHILD.
#ifndef PLATFORM_PROCESS_H_
#define PLATFORM_PROCESS_H_

#include <cstdio>

namespace platform {

// The `flags` of every fork and of every program that is run with them.
constexpr int kRunFlags = 187;

}  // namespace platform

extern "C" {

// Forks as fork() does: 0 in the child, the child's id in the parent, negative on failure. `flags`
// is platform::kRunFlags.
int ALIBCProcForkEx(int flags);

// Runs a program with up to four arguments, of which the first null one ends the list, and waits
// for it. Returns its status.
int ALIBCExec(const char* program, const char* a1, const char* a2, const char* a3, const char* a4);

// Runs a program with the arguments that follow, up to a null one, and waits for it. `flags` is
// platform::kRunFlags. Returns its status.
int ALIBCExecl(const char* program, int flags, ...);

// Starts a program with the arguments that follow the mode, up to a null one. `mode` is always "r".
// Returns a stream of its standard output, which ALIBCPclose() closes, or null when it could not be
// started.
FILE* ALIBCPopen(const char* program, const char* mode, ...);

// Closes a stream of ALIBCPopen() and waits for its program, but for nothing that the program
// itself left running. A program that still writes gets SIGPIPE. Returns its status, or -1, with
// the stream left alone, when ALIBCPopen() did not make it.
int ALIBCPclose(FILE* stream);
}

#endif  // PLATFORM_PROCESS_H_
