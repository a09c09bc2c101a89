// The web API: its replies, and the ssh service that it starts and stops.
#include "platform/api_runner.h"

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include "platform/local_account.h"
#include "platform/process.h"
#include "support/appliance.h"
#include "support/calls.h"

using namespace quendel::test;

namespace {

constexpr char kPidFile[] = "/run/sshd.pid";

Json::Value EnableSsh(const Json::Value& value) {
  Json::Value params;
  params["enable_ssh"] = value;
  return params;
}

Json::Value Call(const Json::Value& params, const char* user = "admin") {
  Json::Value out("before");
  ARVO::APIRunner::Exec(out, "ARVO.Core.Terminal", 3, "set", params, user);
  return out;
}

// The code of a reply's error, 0 for a reply that tells success.
int CodeOf(const Json::Value& reply) {
  if (reply["success"] == true) {
    EXPECT_EQ(reply.size(), 1U);
    return 0;
  }
  EXPECT_EQ(reply["success"], false);
  return reply["error"]["code"].asInt();
}

int CodeOf(const char* api, int version, const char* method) {
  Json::Value out;
  ARVO::APIRunner::Exec(out, api, version, method, EnableSsh(true), "admin");
  return CodeOf(out);
}

// Tells whether anything takes connections on the ssh port.
bool IsListening() {
  const int fd = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(22);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const bool isTaken =
      connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
  close(fd);
  return isTaken;
}

// A process that sshd just forked for a connection can hold the port a moment longer than sshd.
bool StopsListening() {
  const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
  while (IsListening()) {
    if (std::chrono::steady_clock::now() > end) {
      return false;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return true;
}

bool HasSshd() {
  return Exists("/usr/sbin/sshd") && Exists("/usr/bin/ssh");
}

// Logs in with the key; returns 0 when that made the right user at home in the right place.
int LogIn() {
  WriteFile("/tmp/ssh_config",
            "BatchMode yes\nStrictHostKeyChecking no\nUserKnownHostsFile /dev/null\n"
            "IdentityFile /tmp/key\n");
  return ALIBCExecl("/usr/bin/ssh", 187, "-F", "/tmp/ssh_config", "support1@127.0.0.1",
                    "test \"$(id -u):$(id -g):$HOME\" = 50001:100:/run/quendelhome", nullptr);
}

void InstallKey() {
  ASSERT_EQ(ALIBCExecl("/usr/bin/ssh-keygen", 187, "-q", "-t", "ed25519", "-N", "", "-f",
                       "/tmp/key", nullptr),
            0);
  WriteFile("/run/quendelhome/.ssh/authorized_keys", ReadFile("/tmp/key.pub"));
  chmod("/run/quendelhome", 0755);
  chmod("/run/quendelhome/.ssh", 0755);
  ASSERT_EQ(chown("/run/quendelhome", 50001, 100), 0);
}

}  // namespace

TEST(APIRunnerTest, RefusesWhatItDoesNotHave) {
  EXPECT_EQ(CodeOf("ARVO.Core.Other", 3, "set"), 404);
  EXPECT_EQ(CodeOf("arvo.core.terminal", 3, "set"), 404);
  EXPECT_EQ(CodeOf("ARVO.Core.Terminal", 2, "set"), 404);
  EXPECT_EQ(CodeOf("ARVO.Core.Terminal", 3, "get"), 404);
  EXPECT_EQ(CodeOf("", 3, ""), 404);
  EXPECT_EQ(CodeOf(nullptr, 3, "set"), 404);
  EXPECT_EQ(CodeOf("ARVO.Core.Terminal", 3, nullptr), 404);
  EXPECT_FALSE(IsListening());
}

TEST(APIRunnerTest, RefusesOtherUsers) {
  for (const char* user : {"root", "", "Admin", "admin "}) {
    EXPECT_EQ(CodeOf(Call(EnableSsh(true), user)), 403) << user;
  }
  EXPECT_EQ(CodeOf(Call(EnableSsh(true), nullptr)), 403);
  EXPECT_FALSE(IsListening());
}

TEST(APIRunnerTest, RefusesOtherParameters) {
  Json::Value more = EnableSsh(true);
  more["enable_telnet"] = true;
  Json::Value other;
  other["enable"] = true;
  for (const Json::Value& params :
       {EnableSsh("true"), EnableSsh(1), EnableSsh(Json::Value()), more, other,
        Json::Value(Json::objectValue), Json::Value(), Json::Value(true), Json::Value("text"),
        Json::Value(Json::arrayValue)}) {
    EXPECT_EQ(CodeOf(Call(params)), 400) << params.toStyledString();
  }
  EXPECT_FALSE(IsListening());
}

TEST(APIRunnerTest, TakesAServiceThatIsOffForStopped) {
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
}

TEST(APIRunnerTest, FailsWithoutTheService) {
  RemoveFile("/usr/sbin/sshd");
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 500);
}

TEST(APIRunnerTest, FailsWithoutTheMakerOfHostKeys) {
  RemoveFile("/usr/bin/ssh-keygen");
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 500);
}

TEST(APIRunnerTest, FailsWhenTheServiceDoesNotStart) {
  // A service that takes the port away: sshd then ends without writing its number.
  const int taken = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(22);
  ASSERT_EQ(bind(taken, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  WriteFile("/etc/ssh/sshd_config", "ListenAddress 0.0.0.0\n");
  ASSERT_EQ(listen(taken, 1), 0);
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 500);
  close(taken);
}

TEST(APIRunnerTest, StopsNoProcessThatIsNoSshd) {
  const pid_t other = fork();
  if (other == 0) {
    pause();
    _exit(0);
  }
  WriteFile(kPidFile, std::to_string(other) + "\n");
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
  EXPECT_EQ(kill(other, 0), 0);
  for (const char* text : {"", "x", "-1", "0", "99999999999999999999"}) {
    WriteFile(kPidFile, text);
    EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0) << text;
  }
  EXPECT_EQ(kill(other, 0), 0);
  kill(other, SIGKILL);
}

TEST(APIRunnerTest, TakesAServiceThatEndsByItselfForStopped) {
  signal(SIGCHLD, SIG_IGN);    // nothing stays of a child that has ended
  prctl(PR_SET_NAME, "sshd");  // which a child inherits
  const pid_t sshd = fork();
  if (sshd == 0) {
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    _exit(0);
  }
  prctl(PR_SET_NAME, "test");
  WriteFile(kPidFile, std::to_string(sshd) + "\n");
  On("kill").InPlatform().Nth(1).Return(-1, ESRCH);
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
  EXPECT_EQ(CallsInPlatform("kill"), 1);
}

TEST(APIRunnerTest, FailsWhenTheServiceCannotBeStopped) {
  prctl(PR_SET_NAME, "sshd");
  WriteFile(kPidFile, std::to_string(getpid()) + "\n");
  On("kill").InPlatform().Nth(1).Return(-1, EPERM);
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 500);
}

TEST(APIRunnerTest, StartsAndStopsTheService) {
  if (!HasSshd()) {
    GTEST_SKIP() << "The package openssh-server is not installed.";
  }
  EXPECT_FALSE(IsListening());
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 0);
  EXPECT_TRUE(IsListening());
  const std::string process = ReadFile(kPidFile);
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 0);  // runs already
  EXPECT_EQ(ReadFile(kPidFile), process);
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
  EXPECT_TRUE(StopsListening());
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 0);
  EXPECT_TRUE(IsListening());
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
}

TEST(APIRunnerTest, MakesHostKeysThatAreMissing) {
  if (!HasSshd()) {
    GTEST_SKIP() << "The package openssh-server is not installed.";
  }
  for (const char* type : {"rsa", "ecdsa", "ed25519"}) {
    RemoveFile(std::string("/etc/ssh/ssh_host_") + type + "_key");
    RemoveFile(std::string("/etc/ssh/ssh_host_") + type + "_key.pub");
  }
  EXPECT_EQ(CodeOf(Call(EnableSsh(true))), 0);
  EXPECT_TRUE(Exists("/etc/ssh/ssh_host_ed25519_key"));
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
}

TEST(APIRunnerTest, LetsTheSupportAccountInUntilItIsDeleted) {
  if (!HasSshd()) {
    GTEST_SKIP() << "The package openssh-server is not installed.";
  }
  constexpr int kSshFailed = 255;
  InstallKey();
  EXPECT_EQ(LogIn(), kSshFailed);  // nobody listens
  ASSERT_EQ(CodeOf(Call(EnableSsh(true))), 0);
  EXPECT_EQ(LogIn(), kSshFailed);  // no such account
  ASSERT_EQ(ARVOLocalAccountUserPrepareForQuendel("support1", 5), 0);
  EXPECT_EQ(LogIn(), 0);
  const char* const names[] = {"support1"};
  ALIBCMRESULT* const result = ALIBCMResultAlloc();
  EXPECT_EQ(ARVOLocalAccountUserDelete(names, 1, result), 0);
  ALIBCMResultFree(result);
  EXPECT_EQ(LogIn(), kSshFailed);
  EXPECT_EQ(CodeOf(Call(EnableSsh(false))), 0);
}
