// Allocations that fail on demand.
#include "support/scarce_memory.h"

#include <dlfcn.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <string>

#include "support/log.h"
#include "support/own_work.h"

namespace quendel::test {
namespace {

// Allocations up to and with the one that is to fail; negative: there is no such one.
long left = -1;

bool Fails() {
  return left > 0 && !OwnWork::goes_on() && --left == 0;
}

}  // namespace

void FailAllocation(long nth) {
  left = nth;
}

bool AllocateFreely() {
  const bool failed = left == 0;
  left = -1;
  return failed;
}

void WithEachAllocationFailing(const std::function<int()>& work,
                               const std::function<void(int result)>& judge) {
  for (long nth = 1; !testing::Test::HasFailure(); ++nth) {
    SCOPED_TRACE("allocation " + std::to_string(nth));
    ClearLog();
    FailAllocation(nth);
    const int result = work();
    if (!AllocateFreely()) {
      EXPECT_GT(nth, 1) << "the work allocates nothing";
      EXPECT_EQ(result, 0);
      return;
    }
    judge(result);
  }
}

}  // namespace quendel::test

// The library's own operator new behind this one, or a sanitizer's.
void* operator new(size_t size) {
  using New = void* (*)(size_t);
  static const New next =
      reinterpret_cast<New>(dlsym(RTLD_NEXT, sizeof size == 8 ? "_Znwm" : "_Znwj"));
  if (quendel::test::Fails()) {
    throw std::bad_alloc();
  }
  return next(size);
}
