// Calls of the C library that fail, or find something changed, where the platform's own operations
// make them; the kit's fault plan passes those by. A test program that defines one names it to the
// linker, in the CMakeLists.txt.
#ifndef TESTS_PLATFORM_FAILING_CALL_H_
#define TESTS_PLATFORM_FAILING_CALL_H_

#include <cerrno>
#include <functional>
#include <utility>

namespace quendel::test {

// What the calls of one function are to do.
class FailingCall {
 public:
  // Makes the nth call from now, counted from 1, return a result without doing anything; 0 means
  // every call.
  void Fail(int nth, long result, int reason = 0) {
    calls_ = 0;
    armed_ = true;
    nth_ = nth;
    result_ = result;
    reason_ = reason;
  }

  // Has something happen once, just before the next call.
  void BeforeNext(std::function<void()> action) { action_ = std::move(action); }

  // The number of calls from the last Fail() on, or from the start.
  int calls() const { return calls_; }

  // Counts one call; does it unless it is to fail.
  template <typename Result, typename Real>
  Result Do(Real real) {
    ++calls_;
    if (action_) {
      std::exchange(action_, nullptr)();
    }
    if (!armed_ || (nth_ != 0 && nth_ != calls_)) {
      return real();
    }
    errno = reason_ != 0 ? reason_ : errno;
    return static_cast<Result>(result_);
  }

 private:
  bool armed_ = false;
  int calls_ = 0;
  int nth_ = 0;
  long result_ = 0;
  int reason_ = 0;
  std::function<void()> action_;
};

}  // namespace quendel::test

// Defines `name##Calls`, the plan of one function.
#define QUENDEL_FAILING_CALL(Result, name, parameters, ...)                    \
  static quendel::test::FailingCall name##Calls;                               \
  extern "C" Result __real_##name parameters;                                  \
  extern "C" Result __wrap_##name parameters;                                  \
  Result __wrap_##name parameters {                                            \
    return name##Calls.Do<Result>([&] { return __real_##name(__VA_ARGS__); }); \
  }

#endif  // TESTS_PLATFORM_FAILING_CALL_H_
