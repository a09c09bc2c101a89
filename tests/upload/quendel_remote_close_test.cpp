// The end of a support session.
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <deque>

#include "base/json_text.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/faults.h"
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
// The calls of the web API, and what it answers. With no answer queued it reports success.
std::vector<std::string>& ApiCalls() {
  static std::vector<std::string> calls;
  return calls;
}

std::deque<Json::Value>& ApiAnswers() {
  static std::deque<Json::Value> answers;
  return answers;
}

constexpr char kConf[] = "/usr/arvo/etc/quendel.remote.conf";

std::vector<std::string> RequestLines() {
  std::vector<std::string> lines;
  for (const Request& request : Requests()) {
    lines.push_back(request.line);
  }
  return lines;
}

}  // namespace

extern "C" void __wrap__ZN4ARVO9APIRunner4ExecERN4Json5ValueEPKciS5_RKS2_S5_(
    Json::Value& out, const char* api, int version, const char* method, const Json::Value& params,
    const char* user) {
  ApiCalls().push_back(std::string(api) + "|" + std::to_string(version) + "|" + method + "|" +
                       quendel::JsonToText(params) + "|" + user);
  out = JsonOf(R"({"success":true})");
  if (!ApiAnswers().empty()) {
    out = ApiAnswers().front();
    ApiAnswers().pop_front();
  }
}

TEST(RemoteCloseTest, ReportsTheEndAndRemovesTheFile) {
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

TEST(RemoteCloseTest, ReportsAFailedSessionAsFailed) {
  SetIdentity();
  WriteFile(kConf, "remote_account=\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_FAILED), 0);
  EXPECT_THAT(RequestLines(), ElementsAre("POST /action_progress/17/-1/a1/b2/S1 HTTP/1.1"));
  EXPECT_EQ(Calls("ARVOLocalAccountUserDelete"), 0);
  EXPECT_FALSE(Exists(kConf));
}

TEST(RemoteCloseTest, RefusesEveryOtherProgress) {
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

TEST(RemoteCloseTest, DeletesTheAccountBeforeItReports) {
  SetIdentity();
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  WriteFile(kConf, "remote_account=\"support\"\n");
  Record("ARVOLocalAccountUserDelete");
  FailCall("ARVOMYHUBAccountGet", 1, -1);  // so that the report fails
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_THAT(Recorded(), ElementsAre("support|1"));
}

TEST(RemoteCloseTest, ClosesASessionWhole) {
  SetIdentity();
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", "key"), 0);
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\nremote_account=\"support\"\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_FALSE(Exists(kConf));
  EXPECT_THAT(RequestLines(), SizeIs(1));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(RemoteCloseTest, TakesAFileWithoutSettings) {
  SetIdentity();
  for (const char* text : {"", "# none\n"}) {
    WriteFile(kConf, text);
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
    EXPECT_FALSE(Exists(kConf));
  }
  EXPECT_THAT(RequestLines(), SizeIs(2));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(RemoteCloseTest, ReadsTheFileIntoAHashFor1024Pairs) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  Record("ALIBCSzHashAlloc");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(Recorded(), ElementsAre("1024"));
}

TEST(RemoteCloseTest, FailsWithoutMemoryForTheSettings) {
  WriteFile(kConf, "remote_account=\"support\"\n");
  FailCall("ALIBCSzHashAlloc", 1, 0);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Fail to allocate memory for alibc hash")));
  EXPECT_TRUE(Exists(kConf));
}

TEST(RemoteCloseTest, FailsWithoutASession) {
  SetIdentity();
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get quendel key configuration file")));
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(RemoteCloseTest, FailsWhenTheFileCannotBeRead) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  for (const long result : {-1L, -2L}) {
    ClearLog();
    FailCall("ALIBCFileGetPair", 1, result);
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1) << result;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to get quendel key configuration file")));
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_TRUE(Exists(kConf));
}

TEST(RemoteCloseTest, FailsWhenTheAccountCannotBeDeleted) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\nremote_account=\"support\"\n");
  FailCall("ALIBCMResultCoreErrorsGet", 1, 0);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_support_account_user", "ALIBCMResultCoreErrorsGet fail"),
                          Logged(kUnit, "Delete support account failed")));
  EXPECT_THAT(Requests(), IsEmpty());  // the server is not told
  EXPECT_TRUE(Exists(kConf));
}

TEST(RemoteCloseTest, FailsWhenTheServerCannotBeTold) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  Answer({.body = R"({"success":false})"});
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_update_act_request_progress", _),
                                 Logged(kUnit, "Failed to update progress to server")));
  EXPECT_TRUE(Exists(kConf));
  EXPECT_THAT(ApiCalls(), IsEmpty());  // the ssh service is left as it is
}

TEST(RemoteCloseTest, StopsSshdAsTheAdministrator) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(ApiCalls(), ElementsAre(R"(ARVO.Core.Terminal|3|set|{"enable_ssh":false}|admin)"));
}

TEST(RemoteCloseTest, StopsSshdOnlyForExactlyYes) {
  SetIdentity();
  for (const char* value : {"Yes", "YES", "true", "1", "yes!", "no", ""}) {
    WriteFile(kConf, std::string("stop_sshd_after_complete=\"") + value + "\"\n");
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
    EXPECT_THAT(ApiCalls(), IsEmpty()) << value;
  }
  WriteFile(kConf, "other=1\n");
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0);
  EXPECT_THAT(ApiCalls(), IsEmpty());
}

TEST(RemoteCloseTest, SshdThatDoesNotStopFailsNothing) {
  SetIdentity();
  for (const char* reply : {R"({"success":false})", "{}", "[]", "null", R"({"success":"true"})"}) {
    ClearLog();
    WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
    ApiAnswers().push_back(JsonOf(reply));
    EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), 0) << reply;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to stop ssh service"))) << reply;
    EXPECT_FALSE(Exists(kConf));
  }
}

TEST(RemoteCloseTest, FailsWhenTheFileCannotBeRemoved) {
  SetIdentity();
  WriteFile(kConf, "other=1\n");
  FailCall("ALIBCExec", 1, -1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to rm dir '/usr/arvo/etc/quendel.remote.conf'")));
}

TEST(RemoteCloseTest, StopsSshdBeforeItRemovesTheFile) {
  SetIdentity();
  WriteFile(kConf, "stop_sshd_after_complete=\"yes\"\n");
  const auto notRemoved = Logged(kUnit, "Failed to rm dir '/usr/arvo/etc/quendel.remote.conf'");
  FailCall("ALIBCExec", 1, -1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(ApiCalls(), SizeIs(1));
  EXPECT_THAT(Log(), ElementsAre(notRemoved));
  ClearLog();
  ApiAnswers().push_back(JsonOf(R"({"success":false})"));
  FailCall("ALIBCExec", 1, -1);
  EXPECT_EQ(QUENDELRemoteClose(17, QUENDEL_ACT_PROGRESS_DONE), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to stop ssh service"), notRemoved));
}

TEST(RemoteCloseTest, CanBeRepeatedAfterAFailure) {
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
