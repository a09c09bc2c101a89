// The codes that ALIBCErrGet() gives on the stand-alone platform.
#ifndef PLATFORM_STANDALONE_ERROR_CODE_H_
#define PLATFORM_STANDALONE_ERROR_CODE_H_

namespace platform {

// Log lines print these numbers, so they never change their meaning; new ones go to the end.
enum ErrorCode : int {
  kErrorNone = 0,
  kErrorBadArgument = 0x0100,      // a null text, a key that no file could hold, a negative size
  kErrorNoMemory = 0x0200,         // memory ran out
  kErrorNotFound = 0x0300,         // the file or directory does not exist
  kErrorKeyNotFound = 0x0301,      // the file is there, the key is not
  kErrorEmptyValue = 0x0302,       // the key is there, its value is empty
  kErrorSectionNotFound = 0x0303,  // the file is there, the section is not
  kErrorUnreadable = 0x0400,       // it exists and cannot be opened, read or examined
  kErrorNotRegular = 0x0401,       // it is a directory, a FIFO or a device where a file is needed
  kErrorLockFailed = 0x0500,       // the lock beside the file could not be made or taken
  kErrorWriteFailed = 0x0600,      // the new file could not be written; the old one is as it was
  kErrorNotSynchronised = 0x0601,  // the new file is in place, but may not survive a power failure
  kErrorRemoveFailed = 0x0602,     // something below the directory could not be removed
  kErrorNoAccount = 0x0700,        // no account is signed in on this device
  kErrorNotStarted = 0x0800,       // the program, or the child process, could not be started
  kErrorStatusLost = 0x0801,       // it ran, but how it ended is not known
  kErrorNoTimeZone = 0x0900,       // no time zone is configured, or the name is none
  kErrorNoAnswer = 0x0a00,         // no answer is there to be taken
  kErrorRefused = 0x0b00,          // the account is not one that may be changed or deleted
  kErrorAccountTool = 0x0b01,      // the system's account tool failed
  kErrorNoSuchAccount = 0x1d00,  // the account does not exist; callers know this one by its number
};

// Sets the calling thread's last error. Returns -1, the result of most failed operations.
// errno stays as the failed system call left it: callers print that as well.
int Fail(ErrorCode code);

// Does the same inside a catch block, for an exception that must not leave a C operation; errno
// becomes ENOMEM, because memory is all that can run out there.
int FailForException();

// Does the same for a null or impossible argument; errno becomes EINVAL.
int FailForArgument();

}  // namespace platform

#endif  // PLATFORM_STANDALONE_ERROR_CODE_H_
