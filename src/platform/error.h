// The platform's last error.
//
// An operation that fails because of a system call leaves errno as that call set it, too.
#ifndef PLATFORM_ERROR_H_
#define PLATFORM_ERROR_H_

extern "C" {

// Returns the code that the calling thread's last failed platform operation left; log lines print
// it as "ret = %d". It says nothing after an operation that succeeded.
int ALIBCErrGet();
}

#endif  // PLATFORM_ERROR_H_
