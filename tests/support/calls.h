// Calls that a test counts, records, or has end in another way than they would.
//
// Test programs are linked so that the calls of certain functions pass through the kit (the
// wrapped_*.cpp files name them). Nothing changes until a test asks for it, but for sleep(), which
// never waits.
//
//   On("chmod").Return(-1, EROFS);                             every call fails
//   On("ALIBCSzHashAlloc").Nth(2).Return(nullptr);             the second from now on
//   On("unlink").With(kFile).Before([] { Rotate(kLog); });     something happens first
//   On("pread").With(kLog).Shorten(7);                         asked for seven bytes at most
//   On("close").With(kOutput).Replace([](int fd) {             something else is done; a call of
//     close(fd);                                               the same function from in there
//     return -1;                                               does what it always did
//   });
//   On("rename").InPlatform().Return(-1, EIO);                 one that an operation of the
//                                                              platform makes
//
// The library's own calls and those that operations of the platform make are counted apart:
// On("fsync") is about the former, On("fsync").InPlatform() about the latter. A test's own calls
// are the library's.
//
// A forked child goes on with a copy of counts and rules; its calls are not counted in the parent.
// Records are shared.
#ifndef TESTS_SUPPORT_CALLS_H_
#define TESTS_SUPPORT_CALLS_H_

#include <gmock/gmock.h>

#include <any>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

namespace quendel::test {

struct CallRule;

// A rule about the calls of one function. Of several that are about the same call, the last one
// set decides. It holds until ResetCalls() or Restore().
class On {
 public:
  explicit On(const char* function);

  // Which calls, all of them together:
  On& InPlatform();  // those that an operation of the platform makes
  On& Anywhere();    // the library's and the platform's
  On& With(const testing::Matcher<std::string>& argument);  // with such an argument, as recorded
  On& With(long number) { return With(std::to_string(number)); }
  On& When(std::function<bool()> holds);
  On& Nth(int nth);  // the nth of them from now on; 1 is the next

  // What happens then. Something may happen before the call does, or before it ends as told below.
  On& Before(std::function<void()> action);

  // Nothing is done; the result may be a number or a pointer. errno becomes `error`, unless that is
  // 0.
  template <typename Result>
  On& Return(Result result, int error = 0) {
    if constexpr (std::is_null_pointer_v<Result>) {
      return ReturnNumber(0, error);
    } else if constexpr (std::is_pointer_v<Result>) {
      return ReturnNumber(reinterpret_cast<long>(result), error);
    } else {
      return ReturnNumber(static_cast<long>(result), error);
    }
  }

  // The call is asked for no more than this number of bytes.
  On& Shorten(size_t most);

  // A function with the same parameters and result is called instead.
  template <typename Function>
  On& Replace(Function function) {
    return ReplaceBy(std::function(std::move(function)));
  }

 private:
  On& ReturnNumber(long result, int error);
  On& ReplaceBy(std::any function);

  std::shared_ptr<CallRule> rule_;
};

// Lets the function do what it always did.
void Restore(const char* function);

// Return how often the library, and how often the operations of the platform, called the function
// since the program's start or the last ResetCalls().
int Calls(const char* function);
int CallsInPlatform(const char* function);

// Keeps the arguments of each of the library's calls of this function from now on, with "|" between
// them: texts, lists of texts, numbers, JSON values, and an open file's path for its descriptor. Of
// curl_easy_setopt it is the option's number.
void Record(const char* function);

// Returns what was kept, of all recorded functions together, in the order of the calls.
std::vector<std::string> Recorded();

// Starts the counts again, and forgets rules, records and slept seconds.
void ResetCalls();

// Makes the library see this as the current time.
void SetClock(long time);

// Returns the seconds that this process would have slept.
int SleptSeconds();

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_CALLS_H_
