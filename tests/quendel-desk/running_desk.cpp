// A real quendel-desk on the test's appliance, and what a program or a device asks of it.
#include "quendel-desk/running_desk.h"

#include <arpa/inet.h>
#include <curl/curl.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>

#include "support/appliance.h"
#include "support/json.h"
#include "support/require.h"

namespace quendel::test {
namespace {

constexpr char kOut[] = "/run/desk.out";
constexpr char kErr[] = "/run/desk.err";
constexpr uint16_t kPeoplePort = 51791;

pid_t Spawn(std::vector<std::string> arguments, const char* out, const char* err) {
  arguments.insert(arguments.begin(), {QUENDEL_DESK, "--data", kDeskFolder});
  std::vector<char*> argv;
  for (std::string& argument : arguments) {
    argv.push_back(argument.data());
  }
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  constexpr int kAppend = O_WRONLY | O_CREAT | O_APPEND;
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, out, kAppend, 0600);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, err, kAppend, 0600);
  pid_t child = 0;
  const int error = posix_spawn(&child, QUENDEL_DESK, &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  Require(error == 0, "quendel-desk cannot be started");
  return child;
}

bool Listens(uint16_t port) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const int connection = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const bool listens =
      connect(connection, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0;
  close(connection);
  return listens;
}

size_t Append(char* data, size_t size, size_t count, void* text) {
  static_cast<std::string*>(text)->append(data, size * count);
  return size * count;
}

HttpReply Perform(const std::string& url, const std::string& method,
                  const std::vector<std::string>& headers, const std::string& body) {
  HttpReply reply;
  CURL* curl = curl_easy_init();
  curl_slist* list = nullptr;
  for (const std::string& header : headers) {
    list = curl_slist_append(list, header.c_str());
  }
  curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
  curl_easy_setopt(curl, CURLOPT_PATH_AS_IS, 1L);
  curl_easy_setopt(curl, CURLOPT_SSL_VERIFYPEER, 0L);
  curl_easy_setopt(curl, CURLOPT_SSL_VERIFYHOST, 0L);
  curl_easy_setopt(curl, CURLOPT_CUSTOMREQUEST, method.c_str());
  curl_easy_setopt(curl, CURLOPT_HTTPHEADER, list);
  curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, Append);
  curl_easy_setopt(curl, CURLOPT_WRITEDATA, &reply.body);
  curl_easy_setopt(curl, CURLOPT_HEADERFUNCTION, Append);
  curl_easy_setopt(curl, CURLOPT_HEADERDATA, &reply.headers);
  if (!body.empty()) {
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body.c_str());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
  }
  if (curl_easy_perform(curl) == CURLE_OK) {
    curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &reply.status);
  }
  curl_slist_free_all(list);
  curl_easy_cleanup(curl);
  return reply;
}

}  // namespace

RunningDesk::RunningDesk(const std::vector<std::string>& options) : options_(options) {
  if (std::find(options.begin(), options.end(), "--min-free") == options.end()) {
    options_.insert(options_.end(), {"--min-free", "1"});  // the appliance's disks are small
  }
  SetIdentity();
  Start();
}

RunningDesk::~RunningDesk() {
  if (process_ != 0) {
    Stop();
  }
}

void RunningDesk::Start() {
  process_ = Spawn(options_, kOut, kErr);
  while (!Listens(51790) || !Listens(kPeoplePort)) {
    int status = 0;
    Require(waitpid(process_, &status, WNOHANG) == 0, "the desk ended: " + ReadFile(kErr));
    usleep(2000);
  }
}

void RunningDesk::Kill() {
  kill(process_, SIGKILL);
  waitpid(process_, nullptr, 0);
  process_ = 0;
}

void RunningDesk::Stop() {
  kill(process_, SIGTERM);
  int status = 0;
  EXPECT_EQ(waitpid(process_, &status, 0), process_);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status << ReadFile(kErr);
  process_ = 0;
}

bool RunningDesk::Logs(const std::string& text) const {
  for (int i = 0; i < 250; ++i) {
    if (Output().find(text) != std::string::npos) {
      return true;
    }
    usleep(20'000);
  }
  return false;
}
std::string RunningDesk::Output() const {
  return ReadFile(kOut);
}
std::string RunningDesk::Errors() const {
  return ReadFile(kErr);
}

std::string Token() {
  std::string token = ReadFile(std::string(kDeskFolder) + "/token");
  token.pop_back();
  return token;
}

HttpReply AskWith(const std::vector<std::string>& headers, const std::string& method,
                  const std::string& path, const std::string& body) {
  return Perform("http://127.0.0.1:51791" + path, method, headers, body);
}

HttpReply Ask(const std::string& method, const std::string& path, const std::string& body) {
  return AskWith({"Authorization: Bearer " + Token()}, method, "/api/v1" + path, body);
}

Json::Value AskJson(const std::string& path) {
  const HttpReply reply = Ask("GET", path);
  EXPECT_EQ(reply.status, 200) << path << reply.body;
  return JsonOf(reply.body);
}

Json::Value PostAsDevice(const std::string& path, const std::string& body) {
  const HttpReply reply = Perform("https://127.0.0.1:51790" + path, "POST", {}, body);
  EXPECT_EQ(reply.status, 200) << path << reply.body;
  return JsonOf(reply.body);
}

int DeviceNumber(const std::string& serial) {
  const Json::Value list = AskJson("/devices?limit=1000&q=" + serial);
  for (const Json::Value& device : list["devices"]) {
    if (device["serial"] == serial) {
      return device["id"].asInt();
    }
  }
  return 0;
}

std::string DevicePath(const std::string& what) {
  return "/devices/" + std::to_string(DeviceNumber()) + what;
}

int RunDesk(const std::vector<std::string>& arguments, std::string& output) {
  RemoveFile("/run/command.out");
  const pid_t child = Spawn(arguments, "/run/command.out", "/run/command.out");
  int status = 0;
  EXPECT_EQ(waitpid(child, &status, 0), child);
  output = ReadFile("/run/command.out");
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace quendel::test
