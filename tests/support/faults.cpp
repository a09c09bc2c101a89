// The fault plan: which call fails, how often each function was called, and with what.
#include "support/faults.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>
#include <mutex>
#include <set>

#include "support/journal.h"
#include "support/own_work.h"
#include "support/require.h"
#include "support/wrap.h"

namespace quendel::test {
namespace {

constexpr char kPlatformPrefix[] = "platform:";

struct Fault {
  int at;  // the count of the call that fails; 0 means each one
  long result;
  int error;
};

struct Function {
  int calls = 0;
  std::vector<Fault> faults;
  bool recorded = false;
};

// Everything that ResetCalls() resets.
struct Plan {
  std::map<std::string, Function> functions;
  int slept_seconds = 0;
};

std::mutex guard;

// Objects of the whole program, made at their first use, as other units register before this one,
// and never unmade, as the profiler of a coverage build calls wrapped functions at the very end.
Plan& ThePlan() {
  static Plan& plan = *new Plan;
  return plan;
}

std::set<std::string>& Wrapped() {
  static std::set<std::string>& wrapped = *new std::set<std::string>;
  return wrapped;
}

Journal& Records() {
  static Journal& records = *new Journal;
  return records;
}

// Before main(), so that forked children find it there.
[[maybe_unused]] const Journal& earlyRecords = Records();

std::function<void()>& SleepAction() {
  static std::function<void()>& action = *new std::function<void()>;
  return action;
}

// How many platform operations this thread is in.
thread_local int platformDepth = 0;

bool IsPlatformOperation(const char* function) {
  return strncmp(function, "ALIB", 4) == 0 || strncmp(function, "ARVO", 4) == 0;
}

// A name that is not wrapped would make a test prove nothing.
Function& Known(const std::string& name) {
  const bool prefixed = name.rfind(kPlatformPrefix, 0) == 0;
  const std::string function = prefixed ? name.substr(strlen(kPlatformPrefix)) : name;
  Require(Wrapped().count(function) != 0, "calls of " + function + " are not wrapped");
  return ThePlan().functions[name];
}

}  // namespace

void FailCall(const char* function, int nth, long result, int errnoValue) {
  const std::lock_guard<std::mutex> lock(guard);
  Function& known = Known(function);
  known.faults.push_back({nth == 0 ? 0 : known.calls + nth, result, errnoValue});
}

int Calls(const char* function) {
  const std::lock_guard<std::mutex> lock(guard);
  return Known(function).calls;
}

void ResetCalls() {
  const std::lock_guard<std::mutex> lock(guard);
  ThePlan() = Plan();
  Records().Clear();
}

void Record(const char* function) {
  const std::lock_guard<std::mutex> lock(guard);
  Known(function).recorded = true;
}

std::vector<std::string> Recorded() {
  return Records().Texts();
}

void OnSleep(std::function<void()> action) {
  SleepAction() = std::move(action);
}

int SleptSeconds() {
  const std::lock_guard<std::mutex> lock(guard);
  return ThePlan().slept_seconds;
}

bool RegisterWrapped(const char* function) {
  return Wrapped().insert(function).second;
}

bool WrappedCall::Begin(const char* function) {
  const OwnWork ownWork;
  const std::string name = (platformDepth > 0 ? kPlatformPrefix : "") + std::string(function);
  platform_ = IsPlatformOperation(function);
  platformDepth += platform_ ? 1 : 0;

  const std::lock_guard<std::mutex> lock(guard);
  Function& called = ThePlan().functions[name];
  ++called.calls;
  for (const Fault& fault : called.faults) {
    if (fault.at == 0 || fault.at == called.calls) {
      fails_ = true;
      result_ = fault.result;
      errno = fault.error == 0 ? errno : fault.error;
    }
  }
  return called.recorded;
}

WrappedCall::~WrappedCall() {
  platformDepth -= platform_ ? 1 : 0;
}

void WrappedCall::Keep(const std::string& text) {
  const OwnWork ownWork;
  Records().Add(text);
}

void WrappedCall::Append(std::string& text, const std::string& piece) {
  text += (text.empty() ? "" : "|") + piece;
}

}  // namespace quendel::test

// The one function that never does what it is asked to, even when nothing fails it.
QUENDEL_WRAP_BY_HAND(sleep);
extern "C" unsigned int __wrap_sleep(unsigned int seconds) {
  using namespace quendel::test;
  const WrappedCall call("sleep", seconds);
  {
    const std::lock_guard<std::mutex> lock(guard);
    ThePlan().slept_seconds += static_cast<int>(seconds);
  }
  if (SleepAction()) {
    SleepAction()();
  }
  return call.fails() ? call.result<unsigned int>() : 0;
}
