// A support session with a real sshd and a real ssh client: the key opens the device while the
// session lasts, and not afterwards.
#include <gmock/gmock.h>
#include <unistd.h>

#include "platform/api_runner.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

namespace {

constexpr char kConf[] = "/usr/arvo/etc/quendel.remote.conf";

struct Outcome {
  int status;
  std::string output;
};

Outcome Run(const std::string& command) {
  Outcome outcome = {};
  FILE* stream = popen((command + " 2>&1").c_str(), "r");
  for (int c = getc(stream); c != EOF; c = getc(stream)) {
    outcome.output += static_cast<char>(c);
  }
  outcome.status = pclose(stream);
  return outcome;
}

// Logs in over ssh with a key, and nothing but that key, and runs a command there.
Outcome LogIn(const std::string& key, const std::string& command) {
  return Run("/usr/bin/ssh -F none -i " + key +
             " -o IdentitiesOnly=yes -o BatchMode=yes -o StrictHostKeyChecking=no"
             " -o UserKnownHostsFile=/dev/null -o LogLevel=ERROR support@127.0.0.1 " +
             command);
}

void MakeKey(const std::string& path) {
  const Outcome made = Run("/usr/bin/ssh-keygen -q -t ed25519 -N '' -f " + path);
  ASSERT_EQ(made.status, 0) << made.output;
}

// Does what whoever opens a session does.
void OpenSession(const std::string& key, bool stopSshd) {
  Json::Value reply;
  ARVO::APIRunner::Exec(reply, "ARVO.Core.Terminal", 3, "set", JsonOf(R"({"enable_ssh":true})"),
                        "admin");
  ASSERT_EQ(reply, JsonOf(R"({"success":true})"));
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", ReadFile(key + ".pub").c_str()), 0);
  WriteFile(kConf, std::string("remote_account=\"support\"\nstop_sshd_after_complete=\"") +
                       (stopSshd ? "yes" : "no") + "\"\n");
}

class RemoteSupportEndToEndTest : public testing::Test {
 protected:
  void SetUp() override {
    for (const char* program : {"/usr/sbin/sshd", "/usr/bin/ssh", "/usr/bin/ssh-keygen"}) {
      if (access(program, X_OK) != 0) {
        GTEST_SKIP() << "nobody can log in: " << program
                     << " is missing, of the packages openssh-server and openssh-client";
      }
    }
    SetIdentity();
    MakeKey("/tmp/staff");
  }
};

}  // namespace

TEST_F(RemoteSupportEndToEndTest, KeyOpensTheDeviceUntilTheSessionIsClosed) {
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", false));
  const Outcome before = LogIn("/tmp/staff", "'id -un; id -u; id -g; pwd'");
  EXPECT_EQ(before.status, 0);
  EXPECT_EQ(before.output, "support\n50001\n100\n/run/quendelhome\n");

  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(Log(), IsEmpty());
  ASSERT_THAT(Requests(), SizeIs(1));
  EXPECT_THAT(Requests()[0].line, StartsWith("POST /action_progress/17/0/"));
  const Outcome after = LogIn("/tmp/staff", "id -un");
  EXPECT_NE(after.status, 0);
  EXPECT_THAT(after.output, HasSubstr("Permission denied"));  // sshd runs on
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_FALSE(Exists(kConf));
}

TEST_F(RemoteSupportEndToEndTest, SshdThatWasStartedForTheSessionEndsWithIt) {
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", true));
  EXPECT_EQ(LogIn("/tmp/staff", "id -un").output, "support\n");

  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_FAILED), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_THAT(LogIn("/tmp/staff", "id -un").output, HasSubstr("Connection refused"));
}

TEST_F(RemoteSupportEndToEndTest, AnotherKeyOpensNothing) {
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", false));
  MakeKey("/tmp/stranger");
  EXPECT_THAT(LogIn("/tmp/stranger", "id -un").output, HasSubstr("Permission denied"));
}

TEST_F(RemoteSupportEndToEndTest, ReplacedKeyOpensNothingAnyMore) {
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", false));
  MakeKey("/tmp/next");
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/next", false));
  EXPECT_THAT(LogIn("/tmp/staff", "id -un").output, HasSubstr("Permission denied"));
  EXPECT_EQ(LogIn("/tmp/next", "id -un").output, "support\n");
}

TEST_F(RemoteSupportEndToEndTest, SessionCanBeOpenedAgainAfterItWasClosed) {
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", true));
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  ASSERT_NO_FATAL_FAILURE(OpenSession("/tmp/staff", true));
  EXPECT_EQ(LogIn("/tmp/staff", "id -un").output, "support\n");
}

// What the sample appliance's authentication tool prints is a text of 64 hexadecimal digits.
TEST_F(RemoteSupportEndToEndTest, SessionKeyComesFromTheAppliancesTool) {
  char key[129] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(key, sizeof key - 1), 0);
  EXPECT_THAT(key, testing::MatchesRegex("[0-9a-f]{64}\n"));
  char again[129] = {};
  EXPECT_EQ(QUENDELGetRemoteSessionKey(again, sizeof again - 1), 0);
  EXPECT_STREQ(key, again);
}
