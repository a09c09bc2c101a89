// The last error of each thread.
#include "platform/error.h"

#include <cerrno>

#include "platform/standalone/error_code.h"

namespace platform {
namespace {

thread_local ErrorCode lastError = kErrorNone;

}  // namespace

int Fail(ErrorCode code) {
  lastError = code;
  return -1;
}

int FailForException() {
  errno = ENOMEM;
  return Fail(kErrorNoMemory);
}

int FailForArgument() {
  errno = EINVAL;
  return Fail(kErrorBadArgument);
}

}  // namespace platform

int ALIBCErrGet() {
  return platform::lastError;
}
