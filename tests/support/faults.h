// Names that calls.h had before; see there.
#ifndef SUPPORT_FAULTS_H_
#define SUPPORT_FAULTS_H_

#include <cstring>

#include "support/calls.h"

namespace quendel::test {

inline void FailCall(const char* function, int nth, long result, int errnoValue = 0) {
  const bool inPlatform = strncmp(function, "platform:", 9) == 0;
  On call(function + (inPlatform ? 9 : 0));
  call.Nth(nth).Return(result, errnoValue);
  if (inPlatform) {
    call.InPlatform();
  }
}

inline void OnSleep(std::function<void()> action) {
  On("sleep").Before(std::move(action));
}

}  // namespace quendel::test

#endif  // SUPPORT_FAULTS_H_
