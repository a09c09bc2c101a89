// Allocations that fail on demand.
#include "support/scarce_memory.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <string>

#include "support/log.h"
#include "support/own_work.h"

namespace quendel::test {
namespace {

long left =
    -1;  // allocations up to and with the one that is to fail; negative: there is no such one

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

void* operator new(size_t size) {
  void* memory = quendel::test::Fails() ? nullptr : malloc(size == 0 ? 1 : size);
  if (memory == nullptr) {
    throw std::bad_alloc();
  }
  return memory;
}

void operator delete(void* memory) noexcept {
  free(memory);
}

void operator delete(void* memory, size_t /*size*/) noexcept {
  free(memory);
}
