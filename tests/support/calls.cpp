// Counts, rules and records of the wrapped functions.
#include "support/calls.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <system_error>

#include "support/journal.h"
#include "support/own_work.h"
#include "support/require.h"
#include "support/wrap.h"

namespace quendel::test {

namespace {

std::mutex guard;

Wrapped* allWrapped = nullptr;

std::atomic<int> sleptSeconds;

// How many operations of the platform this thread is in.
thread_local int platformDepth = 0;

// Made at its first use, which is before main(), so that forked children find it there, and never
// unmade, as the profiler of a coverage build calls wrapped functions at the very end.
Journal& Records() {
  static Journal& records = *new Journal;
  return records;
}
[[maybe_unused]] const Journal& earlyRecords = Records();

// A name that is not wrapped would make a test prove nothing.
Wrapped& Known(const std::string& name) {
  Wrapped* function = allWrapped;
  while (function != nullptr && function->name != name) {
    function = function->next;
  }
  Require(function != nullptr, "calls of " + name + " are not wrapped");
  return *function;
}

void Forget(Wrapped& function) {
  if (function.rules != nullptr) {
    function.rules->clear();
  }
  function.watched = function.recorded;
}

std::string Joined(const Texts& texts) {
  std::string joined;
  for (const std::string& text : texts) {
    joined += (joined.empty() ? "" : "|") + text;
  }
  return joined;
}

}  // namespace

bool CallRule::IsAbout(bool inPlatform, const Texts& given) {
  if (!(inPlatform ? platform : library)) {
    return false;
  }
  for (const auto& wanted : arguments) {
    if (std::none_of(given.begin(), given.end(),
                     [&](const std::string& text) { return wanted.Matches(text); })) {
      return false;
    }
  }
  return (!holds || holds()) && (++seen == nth || nth == 0);
}

bool CallRule::Decides() const {
  return before || returns || replacement.has_value() || most != std::numeric_limits<size_t>::max();
}

On::On(const char* function) : rule_(std::make_shared<CallRule>()) {
  const std::lock_guard<std::mutex> lock(guard);
  Wrapped& known = Known(function);
  if (known.rules == nullptr) {
    known.rules = new std::vector<std::shared_ptr<CallRule>>;
  }
  known.rules->push_back(rule_);
  known.watched = true;
}

On& On::InPlatform() {
  rule_->library = false;
  rule_->platform = true;
  return *this;
}

On& On::Anywhere() {
  rule_->platform = true;
  return *this;
}

On& On::With(const testing::Matcher<std::string>& argument) {
  rule_->arguments.push_back(argument);
  return *this;
}

On& On::When(std::function<bool()> holds) {
  rule_->holds = std::move(holds);
  return *this;
}

On& On::Nth(int nth) {
  rule_->nth = nth;
  return *this;
}

On& On::Before(std::function<void()> action) {
  rule_->before = std::move(action);
  return *this;
}

On& On::ReturnNumber(long result, int error) {
  rule_->returns = true;
  rule_->result = result;
  rule_->error = error;
  return *this;
}

On& On::Shorten(size_t most) {
  rule_->most = most;
  return *this;
}

On& On::ReplaceBy(std::any function) {
  rule_->replacement = std::move(function);
  return *this;
}

void Restore(const char* function) {
  const std::lock_guard<std::mutex> lock(guard);
  Forget(Known(function));
}

int Calls(const char* function) {
  return Known(function).calls[false];
}

int CallsInPlatform(const char* function) {
  return Known(function).calls[true];
}

void Record(const char* function) {
  const std::lock_guard<std::mutex> lock(guard);
  Wrapped& known = Known(function);
  known.recorded = true;
  known.watched = true;
}

std::vector<std::string> Recorded() {
  return Records().Texts();
}

void ResetCalls() {
  const std::lock_guard<std::mutex> lock(guard);
  for (Wrapped* function = allWrapped; function != nullptr; function = function->next) {
    function->calls[false] = 0;
    function->calls[true] = 0;
    function->recorded = false;
    Forget(*function);
  }
  sleptSeconds = 0;
  Records().Clear();
}

void SetClock(long time) {
  On("time").Return(time);
}

int SleptSeconds() {
  return sleptSeconds;
}

// ---- What a call of a wrapped function meets.

bool Wrapped::IsPlatformOperation() const {
  return strncmp(name, "ALIB", 4) == 0 || strncmp(name, "ARVO", 4) == 0;
}

bool RegisterWrapped(Wrapped& function) {
  function.next = allWrapped;
  allWrapped = &function;
  return true;
}

std::string Fd::Text() const {
  std::error_code error;
  const auto path = std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(number), error);
  return error ? std::to_string(number) : path.string();
}

bool Acting::For(const Wrapped& function) {
  const Acting* acting = innermost;
  while (acting != nullptr && &acting->function_ != &function) {
    acting = acting->outer_;
  }
  return acting != nullptr;
}

WrappedCall::WrappedCall(Wrapped& function)
    : function_(function), unseen_(OwnWork::goes_on() || Acting::For(function)) {
  if (unseen_) {
    return;
  }
  in_platform_ = platformDepth > 0;
  platformDepth += function.IsPlatformOperation() ? 1 : 0;
  ++function.calls[in_platform_];
  watched_ = function.watched;
}

WrappedCall::~WrappedCall() {
  platformDepth -= !unseen_ && function_.IsPlatformOperation() ? 1 : 0;
}

const CallRule* WrappedCall::Judge(const Texts& arguments) {
  const std::lock_guard<std::mutex> lock(guard);
  if (function_.recorded && !in_platform_) {
    Records().Add(Joined(arguments));
  }
  if (function_.rules == nullptr) {
    return nullptr;
  }
  for (const auto& rule : *function_.rules) {
    if (rule->IsAbout(in_platform_, arguments) && rule->Decides()) {
      rule_ = rule;
    }
  }
  return rule_.get();
}

}  // namespace quendel::test

// Its seconds are counted and not waited for.
QUENDEL_WRAP_BY_HAND(sleep, "sleep");
extern "C" unsigned int __wrap_sleep(unsigned int seconds) {
  using namespace quendel::test;
  sleptSeconds += static_cast<int>(seconds);
  return PassCall<unsigned int(unsigned int)>(
      wrapped_sleep, [](unsigned int) { return 0U; }, seconds);
}
