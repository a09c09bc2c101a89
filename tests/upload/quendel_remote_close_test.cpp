// The end of a support session.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <deque>

#include "base/json_text.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_remote_close";
constexpr char kApi[] = "ARVO::APIRunner::Exec";
constexpr char kConf[] = "/usr/arvo/etc/quendel.remote.conf";

class RemoteCloseTest : public testing::Test {
 protected:
  RemoteCloseTest() { AnswerTheApi(R"({"success":true})"); }

  // What the web API answers from now on.
  static void AnswerTheApi(const std::string& reply) {
    On(kApi).Replace([reply](Json::Value& out, const char*, int, const char*, const Json::Value&,
                             const char*) { out = JsonOf(reply); });
  }
};

}  // namespace

TEST_F(RemoteCloseTest, ReportsTheEndAndRemovesTheFile) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"no\"\n");
  Record("ALIBCExec");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  ASSERT_THAT(RequestLines(), ElementsAre("POST /action_progress/17/0/a1/b2/S1 HTTP/1.1"));
  EXPECT_EQ(Requests()[0].body, "{}");
  EXPECT_THAT(Recorded(), ElementsAre("/bin/rm|-f|-r|/usr/arvo/etc/quendel.remote.conf"));
  EXPECT_FALSE(Exists(kConf));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(RemoteCloseTest, ReportsAFailedSessionAsFailed) {
  SetIdentity();
  WriteFile(kConf, "remote_account=\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_FAILED), 0);
  EXPECT_THAT(RequestLines(), ElementsAre("POST /action_progress/17/-1/a1/b2/S1 HTTP/1.1"));
  EXPECT_EQ(Calls("ARVOLocalAccountUserDelete"), 0);
  EXPECT_FALSE(Exists(kConf));
}

TEST_F(RemoteCloseTest, RefusesEveryOtherProgress) {
  SetIdentity();
  WriteFile(kConf, "remote_account=\"support\"\n");
  for (const int progress : {1, -2, -3, 2, INT_MAX, INT_MIN}) {
    ClearLog();
    EXPECT_EQ(QUENDELRemoteClose(17, static_cast<QuendelActionProgress_t>(progress)), -1);
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Bad parameter"))) << progress;
  }
  EXPECT_TRUE(Exists(kConf));
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(Calls("ALIBCSzHashAlloc"), 0);
  EXPECT_EQ(Calls("ARVOLocalAccountUserDelete"), 0);
}

TEST_F(RemoteCloseTest, DeletesTheAccountBeforeItReports) {
  SetIdentity();
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  WriteFile(kConf, "remote_account=\"support\"\n");
  Record("ARVOLocalAccountUserDelete");
  On("ARVOMYHUBAccountGet").Nth(1).Return(-1);  // so that the report fails
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_THAT(Recorded(), ElementsAre("support|1"));
}

TEST_F(RemoteCloseTest, ClosesASessionWhole) {
  SetIdentity();
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\nremote_account=\"support\"\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_FALSE(Exists(kConf));
  EXPECT_THAT(RequestLines(), SizeIs(1));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(RemoteCloseTest, TakesAFileWithoutSettings) {
  SetIdentity();
  for (const char* text : {"", "# none\n"}) {
    WriteFile(kConf, text);
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
    EXPECT_FALSE(Exists(kConf));
  }
  EXPECT_THAT(RequestLines(), SizeIs(2));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST_F(RemoteCloseTest, ReadsTheFileIntoAHashFor1024Pairs) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  Record("ALIBCSzHashAlloc");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(Recorded(), ElementsAre("1024"));
}

TEST_F(RemoteCloseTest, FailsWithoutMemoryForTheSettings) {
  WriteFile(kConf, "remote_account=\"support\"\n");
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Fail to allocate memory for alibc hash")));
  EXPECT_TRUE(Exists(kConf));
}

TEST_F(RemoteCloseTest, FailsWithoutASession) {
  SetIdentity();
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get quendel key configuration file")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(RemoteCloseTest, FailsWhenTheFileCannotBeRead) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  for (const long result : {-1L, -2L}) {
    ClearLog();
    On("ALIBCFileGetPair").Nth(1).Return(result);
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1) << result;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get quendel key configuration file")));
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_TRUE(Exists(kConf));
}

TEST_F(RemoteCloseTest, FailsWhenTheAccountCannotBeDeleted) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\nremote_account=\"support\"\n");
  On("ALIBCMResultCoreErrorsGet").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_support_account_user", "ALIBCMResultCoreErrorsGet fail"),
                          Logged(kUnit, "Delete support account failed")));
  EXPECT_THAT(Requests(), IsEmpty());  // the server is not told
  EXPECT_TRUE(Exists(kConf));
}

TEST_F(RemoteCloseTest, FailsWhenTheServerCannotBeTold) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  Answer({.body = R"({"success":false})"});
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_update_act_request_progress", _),
                                 Logged(kUnit, "Failed to update progress to server")));
  EXPECT_TRUE(Exists(kConf));
  EXPECT_EQ(Calls(kApi), 0);  // the ssh service is left as it is
}

TEST_F(RemoteCloseTest, StopsSshdAsTheAdministrator) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  Record(kApi);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(Recorded(), ElementsAre(R"(ARVO.Core.Terminal|3|set|{"enable_ssh":false}|admin)"));
}

TEST_F(RemoteCloseTest, StopsSshdOnlyForExactlyYes) {
  SetIdentity();
  for (const char* value : {"Yes", "YES", "true", "1", "yes!", "no", ""}) {
    WriteFile(kConf, std::string("stop_sshd_after_complete=\"") + value + "\"\n");
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
    EXPECT_EQ(Calls(kApi), 0) << value;
  }
  WriteFile(kConf, "other=1\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_EQ(Calls(kApi), 0);
}

TEST_F(RemoteCloseTest, SshdThatDoesNotStopFailsNothing) {
  SetIdentity();
  for (const char* reply : {R"({"success":false})", "{}", "[]", "null", R"({"success":"true"})"}) {
    ClearLog();
    WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
    AnswerTheApi(reply);
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0) << reply;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to stop ssh service"))) << reply;
    EXPECT_FALSE(Exists(kConf));
  }
}

TEST_F(RemoteCloseTest, FailsWhenTheFileCannotBeRemoved) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to rm dir '/usr/arvo/etc/quendel.remote.conf'")));
}

TEST_F(RemoteCloseTest, StopsSshdBeforeItRemovesTheFile) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  const auto notRemoved = Logged(kUnit, "Failed to rm dir '/usr/arvo/etc/quendel.remote.conf'");
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_EQ(Calls(kApi), 1);
  EXPECT_THAT(Log(), ElementsAre(notRemoved));
  ClearLog();
  AnswerTheApi(R"({"success":false})");
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to stop ssh service"), notRemoved));
}

TEST_F(RemoteCloseTest, CanBeRepeatedAfterAFailure) {
  SetIdentity();
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  WriteFile(kConf, "remote_account=\"support\"\n");
  Answer({.status = 500});
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  ClearLog();
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_FALSE(Exists(kConf));
}
