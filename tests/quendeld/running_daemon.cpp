#include "running_daemon.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>

#include "common/control_socket.h"
#include "json.h"
#include "support/appliance.h"
#include "support/server.h"

namespace quendel::test {
namespace {

constexpr char kLog[] = "/tmp/quendeld.log";

pid_t Start() {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, kLog, O_WRONLY | O_CREAT | O_APPEND,
                                   0600);
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  const char* const arguments[] = {QUENDELD, "--foreground", "--worker", WORKER, nullptr};
  pid_t process = 0;
  EXPECT_EQ(posix_spawn(&process, QUENDELD, &actions, nullptr, const_cast<char* const*>(arguments),
                        environ),
            0);
  posix_spawn_file_actions_destroy(&actions);
  return process;
}

}  // namespace

bool Within(double seconds, const std::function<bool()>& holds) {
  const auto end = std::chrono::steady_clock::now() + std::chrono::duration<double>(seconds);
  while (!holds()) {
    if (std::chrono::steady_clock::now() > end) {
      return false;
    }
    usleep(20'000);
  }
  return true;
}

void SwitchService(bool enabled) {
  SetIdentity({{"serial_number", "S1"},
               {"account_email", "mail1"},
               {"account_field_a", "a1"},
               {"account_field_b", "b2"},
               {"timezone", "Etc/UTC"},
               {"service_quendeld", enabled ? "yes" : "no"}});
}

void AnswerAll(const std::string& body, const std::string& head) {
  WriteFile("/run/test-server/draft-all", head + "\n\n" + body);
  std::filesystem::rename("/run/test-server/draft-all", "/run/test-server/default");
}

int CountRequests(const std::string& line) {
  int count = 0;
  for (const std::string& file : RequestFiles()) {
    std::ifstream request(file, std::ios::binary);
    std::string first;
    std::getline(request, first);
    count += first.rfind(line, 0) == 0 ? 1 : 0;
  }
  return count;
}

std::string LastBody(const std::string& line) {
  std::string body;
  for (const Request& request : Requests()) {
    if (request.line.rfind(line, 0) == 0) {
      body = request.body;
    }
  }
  return body;
}

bool AnyWorkerRuns() {
  namespace fs = std::filesystem;
  for (const fs::directory_entry& entry : fs::directory_iterator("/proc")) {
    std::ifstream file(entry.path() / "environ", std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    if (text.str().find("QUENDEL_WORKER=1") != std::string::npos) {
      return true;
    }
  }
  return false;
}

RunningDaemon::RunningDaemon(Settings settings) {
  std::map<std::string, std::string> all = {
      {"heartbeat_interval", "0.3"},   {"heartbeat_backoff_limit", "1"},
      {"first_heartbeat_within", "0"}, {"collection_interval", "86400"},
      {"collection_retry", "1"},       {"sample_interval", "3600"},
      {"conversation_limit", "10"},    {"kill_after", "1"},
      {"free_space_mb", "1"},          {"rotation_quiet", "0.5"},
      {"rotation_wait", "3"}};
  for (const auto& [key, value] : settings) {
    all[key] = value;
  }
  std::string text;
  for (const auto& [key, value] : all) {
    text += key + "=" + value + "\n";
  }
  WriteFile("/usr/arvo/etc/quendeld.conf", text);
  RemoveFile("/run/quendel/control");
  process_ = Start();
  EXPECT_TRUE(Within(10, [] { return Exists("/run/quendel/control"); })) << LogText();
}

RunningDaemon::~RunningDaemon() {
  if (process_ > 0) {
    EXPECT_EQ(End(SIGTERM), 0) << LogText();
  }
}

void RunningDaemon::Signal(int number) const {
  kill(process_, number);
}

int RunningDaemon::End(int number) {
  kill(process_, number);
  int status = 0;
  waitpid(process_, &status, 0);
  process_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

Json::Value RunningDaemon::Ask(const std::string& command) {
  const auto answer = programs::AskDaemon("{\"command\":\"" + command + "\"}");
  return answer ? quendeld::JsonFromText(*answer).value_or(Json::Value()) : Json::Value();
}

std::string RunningDaemon::LogText() {
  return Exists(kLog) ? ReadFile(kLog) : "";
}

bool RunningDaemon::HasLogged(const std::string& text) {
  return LogText().find(text) != std::string::npos;
}

}  // namespace quendel::test
