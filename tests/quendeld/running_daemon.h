// The real quendeld on the test's appliance, against the scripted server.
#ifndef TESTS_QUENDELD_RUNNING_DAEMON_H_
#define TESTS_QUENDELD_RUNNING_DAEMON_H_

#include <json/value.h>
#include <sys/types.h>

#include <functional>
#include <initializer_list>
#include <string>
#include <utility>

namespace quendel::test {

// Waits until it holds, at most so many seconds. Returns whether it does.
bool Within(double seconds, const std::function<bool()>& holds);

// Gives the device an identity whose service is enabled or not.
void SwitchService(bool enabled);

// What the server answers to every request that no other answer is queued for.
void AnswerAll(const std::string& body, const std::string& head = "status 200");

// How many requests arrived whose line begins with this, and the last of their bodies.
int CountRequests(const std::string& line);
std::string LastBody(const std::string& line);

// Whether a process bears the mark of a worker.
bool AnyWorkerRuns();

class RunningDaemon {
 public:
  using Settings = std::initializer_list<std::pair<const std::string, std::string>>;

  // Writes settings that make it fast, and these over them, and starts it.
  explicit RunningDaemon(Settings settings = {});
  // Stops it in peace unless it was ended before.
  ~RunningDaemon();
  RunningDaemon(const RunningDaemon&) = delete;
  RunningDaemon& operator=(const RunningDaemon&) = delete;

  void Signal(int number) const;
  // Ends it and returns its status: the exit status, or 128 + the signal.
  int End(int number);
  pid_t process() const { return process_; }

  // Asks through the control socket. A null value when it does not answer.
  static Json::Value Ask(const std::string& command);
  static Json::Value Status() { return Ask("status"); }
  // What it and its workers logged.
  static std::string LogText();
  static bool HasLogged(const std::string& text);

 private:
  pid_t process_ = -1;
};

}  // namespace quendel::test

#endif  // TESTS_QUENDELD_RUNNING_DAEMON_H_
