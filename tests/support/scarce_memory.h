// Allocations that fail on demand.
#ifndef TESTS_SUPPORT_SCARCE_MEMORY_H_
#define TESTS_SUPPORT_SCARCE_MEMORY_H_

#include <functional>

namespace quendel::test {

// Makes the nth allocation from now on fail, and only that one. The kit's own do not count. A
// forked child goes on counting by itself.
void FailAllocation(long nth);

// Ends that. Returns true when the allocation has failed meanwhile.
bool AllocateFreely();

// Does the work again and again, each time with the next allocation failing, until it gets by with
// those before, which must give 0. `judge` gets each result before that. The log starts empty each
// time. Stops at the first failed expectation.
void WithEachAllocationFailing(const std::function<int()>& work,
                               const std::function<void(int result)>& judge);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_SCARCE_MEMORY_H_
