// How the calls of a function are made to pass through the kit: one line in a wrapped_*.cpp file,
// from which the build also takes the linker option.
//
//   QUENDEL_WRAP(name, result type, (parameters), arguments...);
//   QUENDEL_WRAP_CPP(linker's name, "its name in tests", result type, (parameters), arguments...);
//   QUENDEL_WRAP_BY_HAND(name, "its name in tests"); and __wrap_name() written out, which does its
//       work by PassCall(). For functions with a variable number of arguments.
#ifndef TESTS_SUPPORT_WRAP_H_
#define TESTS_SUPPORT_WRAP_H_

#include <gmock/gmock.h>
#include <json/value.h>

#include <algorithm>
#include <any>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "base/json_text.h"
#include "support/own_work.h"
#include "support/require.h"

namespace quendel::test {

// What comes of some of a function's calls: see On.
struct CallRule {
  // Counts a call that it is about but for its position. Returns whether it is about this one.
  bool IsAbout(bool inPlatform, const std::vector<std::string>& given);
  bool Decides() const;

  bool library = true;    // is about the library's calls
  bool platform = false;  // about the platform's
  std::vector<testing::Matcher<std::string>> arguments;
  std::function<bool()> holds;
  int nth = 0;  // 0: each
  int seen = 0;

  std::function<void()> before;
  bool returns = false;
  long result = 0;
  int error = 0;
  size_t most = SIZE_MAX;
  std::any replacement;
};

// A wrapped function. These exist before anything runs, as some functions are called very early,
// and counting needs no memory.
struct Wrapped {
  constexpr explicit Wrapped(const char* nameInTests) : name(nameInTests) {}
  bool IsPlatformOperation() const;

  const char* name;
  std::atomic<int> calls[2] = {};                           // the library's, the platform's
  std::atomic<bool> watched = false;                        // there is something below
  bool recorded = false;                                    // the library's calls are
  std::vector<std::shared_ptr<CallRule>>* rules = nullptr;  // never unmade
  Wrapped* next = nullptr;                                  // in the list of all
};

// Makes the function known by its name. Returns true.
bool RegisterWrapped(Wrapped& function);

// ---- Arguments that say more than their type, made in the line of a wrapped function.

// An argument that is shown in another way than its type would have it.
struct Shown {};

// A descriptor, shown as the path of its open file.
struct Fd : Shown {
  explicit Fd(int fd) : number(fd) {}
  operator int() const { return number; }
  std::string Text() const;

  int number;
};

// A number of bytes that can be lessened.
struct Count : Shown {
  explicit Count(size_t& number) : bytes(number) {}
  operator size_t() const { return bytes; }
  std::string Text() const { return std::to_string(bytes); }

  size_t& bytes;
};

using Texts = std::vector<std::string>;

// Addresses of other things than texts say nothing, and a buffer may not have been filled yet.
template <typename Argument>
void Show(Texts& texts, Argument& argument) {
  using Plain = std::remove_const_t<Argument>;
  if constexpr (std::is_base_of_v<Shown, Plain>) {
    texts.push_back(argument.Text());
  } else if constexpr (std::is_same_v<Argument, const Json::Value>) {
    texts.push_back(JsonToText(argument));
  } else if constexpr (std::is_integral_v<Plain> || std::is_enum_v<Plain>) {
    texts.push_back(std::to_string(static_cast<long>(argument)));
  } else if constexpr (std::is_same_v<Plain, const char*>) {
    texts.emplace_back(argument == nullptr ? "(null)" : argument);
  } else if constexpr (std::is_convertible_v<Plain, const char* const*>) {
    for (const char* const* each = argument; *each != nullptr; ++each) {
      texts.emplace_back(*each);
    }
  }
}

template <typename Argument>
void ShortenTo(size_t most, Argument& argument) {
  if constexpr (std::is_same_v<std::remove_const_t<Argument>, Count>) {
    argument.bytes = std::min(argument.bytes, most);
  }
}

// ---- One call.

// Counted at its start; what runs before its end is inside it.
class WrappedCall {
 public:
  explicit WrappedCall(Wrapped& function);
  ~WrappedCall();
  WrappedCall(const WrappedCall&) = delete;
  WrappedCall& operator=(const WrappedCall&) = delete;

  // Whether there may be more to do than to make the call.
  bool watched() const { return watched_; }

  // Keeps the arguments. Returns the rule about this call, or null.
  const CallRule* Judge(const Texts& arguments);

 private:
  Wrapped& function_;
  bool unseen_;
  bool in_platform_ = false;
  bool watched_ = false;
  std::shared_ptr<CallRule> rule_;
};

// While one lives, the calling thread acts for a rule: calls of this function are not seen.
class Acting {
 public:
  explicit Acting(const Wrapped& function) : function_(function), outer_(innermost) {
    innermost = this;
  }
  ~Acting() { innermost = outer_; }
  Acting(const Acting&) = delete;
  Acting& operator=(const Acting&) = delete;

  static bool For(const Wrapped& function);

 private:
  static inline thread_local const Acting* innermost = nullptr;

  const Wrapped& function_;
  const Acting* outer_;
};

template <typename Result>
Result ResultFrom(long number) {
  if constexpr (std::is_pointer_v<Result>) {
    return reinterpret_cast<Result>(number);
  } else {
    return static_cast<Result>(number);
  }
}

// Makes the call, or has happen what a rule says. The signature is what a test replaces the
// function by.
template <typename Signature, typename Real, typename... Arguments>
auto PassCall(Wrapped& function, Real real, Arguments&&... arguments) {
  using Result = typename std::function<Signature>::result_type;
  WrappedCall call(function);
  const CallRule* rule = nullptr;
  if (call.watched()) {
    const OwnWork ownWork;
    const int savedErrno = errno;
    Texts texts;
    (Show(texts, arguments), ...);
    rule = call.Judge(texts);
    errno = savedErrno;
  }
  if (rule == nullptr) {
    return real(arguments...);
  }
  const Acting acting(function);
  if (rule->before) {
    rule->before();
  }
  if (rule->returns) {
    errno = rule->error == 0 ? errno : rule->error;
    return ResultFrom<Result>(rule->result);
  }
  if (rule->replacement.has_value()) {
    const auto* replacement = std::any_cast<std::function<Signature>>(&rule->replacement);
    Require(replacement != nullptr, "a function is replaced by one with another signature");
    return (*replacement)(arguments...);
  }
  (ShortenTo(rule->most, arguments), ...);
  return real(arguments...);
}

}  // namespace quendel::test

#define QUENDEL_WRAP_BY_HAND(symbol, nameInTests)              \
  static quendel::test::Wrapped wrapped_##symbol(nameInTests); \
  [[maybe_unused]] static const bool registers_##symbol =      \
      quendel::test::RegisterWrapped(wrapped_##symbol)

#define QUENDEL_WRAP_CPP(symbol, nameInTests, Result, parameters, ...)                   \
  QUENDEL_WRAP_BY_HAND(symbol, nameInTests);                                             \
  extern "C" Result __real_##symbol parameters;                                          \
  extern "C" Result __wrap_##symbol parameters;                                          \
  Result __wrap_##symbol parameters {                                                    \
    return quendel::test::PassCall<Result parameters>(wrapped_##symbol, __real_##symbol, \
                                                      ##__VA_ARGS__);                    \
  }                                                                                      \
  static_assert(true)

// The compiler compares the types with the function's own.
#define QUENDEL_WRAP(name, Result, parameters, ...)                 \
  QUENDEL_WRAP_CPP(name, #name, Result, parameters, ##__VA_ARGS__); \
  static_assert(sizeof(static_cast<decltype(&__real_##name)>(&name)) != 0)

#endif  // TESTS_SUPPORT_WRAP_H_
