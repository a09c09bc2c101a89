// How a function is made to pass through the fault plan: one QUENDEL_WRAP line in a faults_*.cpp
// file, from which the build also takes the linker option.
#ifndef SUPPORT_WRAP_H_
#define SUPPORT_WRAP_H_

#include <string>
#include <type_traits>

namespace quendel::test {

// One call of a wrapped function, counted at its start; what runs before its end is inside it.
class WrappedCall {
 public:
  template <typename... Arguments>
  explicit WrappedCall(const char* function, const Arguments&... arguments) {
    if (Begin(function)) {
      std::string text;
      (Describe(text, arguments), ...);
      Keep(text);
    }
  }
  ~WrappedCall();
  WrappedCall(const WrappedCall&) = delete;
  WrappedCall& operator=(const WrappedCall&) = delete;

  bool fails() const { return fails_; }

  template <typename Result>
  Result result() const {
    if constexpr (std::is_pointer_v<Result>) {
      return reinterpret_cast<Result>(result_);
    } else {
      return static_cast<Result>(result_);
    }
  }

 private:
  // Returns true when the arguments are to be kept.
  bool Begin(const char* function);
  static void Keep(const std::string& text);

  // Addresses of other things than texts say nothing, and a buffer may not have been filled yet.
  template <typename Argument>
  static void Describe(std::string& text, const Argument& argument) {
    if constexpr (std::is_integral_v<Argument> || std::is_enum_v<Argument>) {
      Append(text, std::to_string(static_cast<long>(argument)));
    } else if constexpr (std::is_same_v<Argument, const char*>) {
      Append(text, argument == nullptr ? "(null)" : argument);
    } else if constexpr (std::is_convertible_v<Argument, const char* const*>) {
      for (const char* const* each = argument; *each != nullptr; ++each) {
        Append(text, *each);
      }
    }
  }
  static void Append(std::string& text, const std::string& piece);

  bool platform_ = false;
  bool fails_ = false;
  long result_ = 0;
};

// Makes the function known by its name. Returns true.
bool RegisterWrapped(const char* function);

}  // namespace quendel::test

// QUENDEL_WRAP(result type, name, (parameters), arguments...)
#define QUENDEL_WRAP(Result, function, parameters, ...)                             \
  extern "C" Result __real_##function parameters;                                   \
  static_assert(sizeof(static_cast<decltype(&__real_##function)>(&function)) != 0); \
  extern "C" Result __wrap_##function parameters {                                  \
    const quendel::test::WrappedCall call(#function, ##__VA_ARGS__);                \
    return call.fails() ? call.result<Result>() : __real_##function(__VA_ARGS__);   \
  }                                                                                 \
  QUENDEL_WRAP_BY_HAND(function)

// QUENDEL_WRAP_BY_HAND(name): the same for a function whose __wrap_ is written out.
#define QUENDEL_WRAP_BY_HAND(function) \
  [[maybe_unused]] static const bool wraps_##function = quendel::test::RegisterWrapped(#function)

#endif  // SUPPORT_WRAP_H_
