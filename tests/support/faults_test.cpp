// The fault plan.
#include "support/faults.h"

#include <curl/curl.h>
#include <gmock/gmock.h>
#include <sys/shm.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>

#include "platform/api_runner.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "platform/process.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kFile[] = "/tmp/file";

}  // namespace

TEST(FailCallTest, FailsTheNthCallFromNowOn) {
  WriteFile(kFile, "");
  EXPECT_EQ(chmod(kFile, 0600), 0);
  FailCall("chmod", 2, -1, EIO);
  EXPECT_EQ(chmod(kFile, 0601), 0);
  errno = 0;
  EXPECT_EQ(chmod(kFile, 0602), -1);
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(chmod(kFile, 0603), 0);
}

TEST(FailCallTest, KeepsAFailedCallFromDoingItsWork) {
  WriteFile(kFile, "");
  ASSERT_EQ(chmod(kFile, 0600), 0);
  FailCall("chmod", 1, -1);
  ASSERT_EQ(chmod(kFile, 0644), -1);
  struct stat status = {};
  stat(kFile, &status);
  EXPECT_EQ(status.st_mode & 07777, 0600U);
}

TEST(FailCallTest, FailsEachCallForZero) {
  FailCall("chmod", 0, -7);
  for (int i = 0; i < 5; ++i) {
    EXPECT_EQ(chmod("/", 0755), -7);
  }
}

TEST(FailCallTest, LeavesErrnoAloneWithoutANumberForIt) {
  FailCall("chmod", 1, -1);
  errno = EAGAIN;
  chmod("/", 0755);
  EXPECT_EQ(errno, EAGAIN);
}

TEST(FailCallTest, TakesSeveralFaultsOfOneFunction) {
  FailCall("ALIBCFileExist", 1, 11);
  FailCall("ALIBCFileExist", 3, 33);
  EXPECT_EQ(ALIBCFileExist("/"), 11);
  EXPECT_EQ(ALIBCFileExist("/"), 1);
  EXPECT_EQ(ALIBCFileExist("/"), 33);
}

TEST(FailCallTest, ReturnsPointers) {
  FailCall("calloc", 1, 0);
  FailCall("shmat", 1, -1);
  FailCall("ALIBCSzHashAlloc", 1, 0);
  FailCall("curl_easy_init", 1, 0);
  void* memory = calloc(1, 20256);
  EXPECT_EQ(memory, nullptr);
  free(memory);
  EXPECT_EQ(shmat(0, nullptr, 0), reinterpret_cast<void*>(-1));
  EXPECT_EQ(platform::OwnedHash(1).get(), nullptr);
  EXPECT_EQ(curl_easy_init(), nullptr);
}

TEST(FailCallTest, ReturnsCurlCodes) {
  CURL* handle = curl_easy_init();
  FailCall("curl_easy_setopt", 2, CURLE_UNKNOWN_OPTION);
  EXPECT_EQ(curl_easy_setopt(handle, CURLOPT_URL, "https://x"), CURLE_OK);
  EXPECT_EQ(curl_easy_setopt(handle, CURLOPT_PORT, 51790L), CURLE_UNKNOWN_OPTION);
  FailCall("curl_easy_perform", 1, CURLE_RECV_ERROR);
  EXPECT_EQ(curl_easy_perform(handle), CURLE_RECV_ERROR);
  FailCall("curl_easy_getinfo", 1, CURLE_BAD_FUNCTION_ARGUMENT);
  long status = 7;
  EXPECT_EQ(curl_easy_getinfo(handle, CURLINFO_RESPONSE_CODE, &status),
            CURLE_BAD_FUNCTION_ARGUMENT);
  EXPECT_EQ(status, 7);
  curl_easy_cleanup(handle);
}

TEST(FailCallTest, ReachesForkedChildrenInTheirOwnCount) {
  FailCall("chmod", 2, -1);
  ASSERT_EQ(chmod("/tmp", 01777), 0);
  const pid_t child = fork();
  if (child == 0) {
    _exit(chmod("/tmp", 01777) == -1 ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(Calls("chmod"), 1);
  EXPECT_EQ(chmod("/tmp", 01777), -1);
}

TEST(FailCallDeathTest, RefusesAFunctionThatIsNotWrapped) {
  EXPECT_DEATH(FailCall("no_such_function", 1, 0), "calls of no_such_function are not wrapped");
  EXPECT_DEATH(FailCall("platform:no_such", 1, 0), "calls of no_such are not wrapped");
  EXPECT_DEATH(Calls("no_such_function"), "not wrapped");
  EXPECT_DEATH(Record("no_such_function"), "not wrapped");
}

TEST(CallsTest, CountsEveryCall) {
  FailCall("chmod", 2, -1);
  for (int i = 0; i < 3; ++i) {
    chmod("/tmp", 01777);
  }
  EXPECT_EQ(Calls("chmod"), 3);
  EXPECT_EQ(Calls("chown"), 0);
}

TEST(CallsTest, CountsThePlatformsOwnCallsApart) {
  SetIdentity();
  FailCall("rename", 1, -1);
  ASSERT_GT(ALIBCFileSetKeyValue("/usr/arvo/etc/device.conf", "timezone", "UTC", 0), 0);
  EXPECT_EQ(Calls("rename"), 0);
  EXPECT_EQ(Calls("platform:rename"), 1);
  EXPECT_EQ(Calls("ALIBCFileSetKeyValue"), 1);
  EXPECT_EQ(rename("/tmp/a", "/tmp/b"), -1);
}

TEST(CallsTest, LetsThePlatformsOwnCallsFail) {
  SetIdentity();
  const std::string before = ReadFile("/usr/arvo/etc/device.conf");
  FailCall("platform:rename", 1, -1, EIO);
  EXPECT_LT(ALIBCFileSetKeyValue("/usr/arvo/etc/device.conf", "timezone", "UTC", 0), 0);
  EXPECT_EQ(ReadFile("/usr/arvo/etc/device.conf"), before);
}

TEST(ResetCallsTest, ForgetsEverything) {
  Record("chmod");
  FailCall("chmod", 2, -1);
  chmod("/tmp", 01777);
  sleep(3);
  ResetCalls();
  EXPECT_EQ(Calls("chmod"), 0);
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_THAT(Recorded(), IsEmpty());
  EXPECT_EQ(chmod("/tmp", 01777), 0);
  EXPECT_EQ(chmod("/tmp", 01777), 0);
  EXPECT_THAT(Recorded(), IsEmpty());
}

TEST(RecordTest, KeepsTextsAndNumbers) {
  Record("chmod");
  Record("ALIBCFileGetKeyValue");
  chmod("/tmp", 01777);
  char value[8];
  ALIBCFileGetKeyValue("/a", "b", value, sizeof value, 0);
  unlink("/tmp/none");
  EXPECT_THAT(Recorded(), ElementsAre("/tmp|1023", "/a|b|8|0"));
}

TEST(RecordTest, KeepsTheCallsOfForkedChildren) {
  Record("chmod");
  const pid_t child = fork();
  if (child == 0) {
    chmod("/tmp", 01777);
    _exit(0);
  }
  waitpid(child, nullptr, 0);
  EXPECT_THAT(Recorded(), ElementsAre("/tmp|1023"));
}

TEST(RecordTest, KeepsTheOptionOfATransfer) {
  Record("curl_easy_setopt");
  CURL* handle = curl_easy_init();
  curl_easy_setopt(handle, CURLOPT_URL, "https://x");
  curl_easy_cleanup(handle);
  EXPECT_THAT(Recorded(), ElementsAre(std::to_string(CURLOPT_URL)));
}

TEST(SleepTest, NeverWaits) {
  timespec before = {};
  timespec after = {};
  clock_gettime(CLOCK_MONOTONIC, &before);
  EXPECT_EQ(sleep(3600), 0U);
  EXPECT_EQ(sleep(1), 0U);
  clock_gettime(CLOCK_MONOTONIC, &after);
  EXPECT_LT(after.tv_sec - before.tv_sec, 60);
  EXPECT_EQ(SleptSeconds(), 3601);
  EXPECT_EQ(Calls("sleep"), 2);
}

TEST(SleepTest, RunsTheActionEachTime) {
  int runs = 0;
  OnSleep([&runs] { ++runs; });
  sleep(1);
  sleep(5);
  EXPECT_EQ(runs, 2);
  OnSleep(nullptr);
  sleep(1);
  EXPECT_EQ(runs, 2);
}

TEST(SleepTest, CanBeInterrupted) {
  FailCall("sleep", 1, 4);
  EXPECT_EQ(sleep(9), 4U);
}

TEST(ApiRunnerTest, IsRecordedAndFailsUnderItsOwnName) {
  Record("ARVO::APIRunner::Exec");
  FailCall("ARVO::APIRunner::Exec", 1, 0);
  Json::Value params;
  params["enable_ssh"] = false;
  Json::Value out = "before";
  ARVO::APIRunner::Exec(out, "ARVO.Core.None", 3, "set", params, "admin");
  EXPECT_EQ(out, "before");
  ARVO::APIRunner::Exec(out, "ARVO.Core.None", 3, "set", params, "admin");
  EXPECT_EQ(out["success"], false);
  EXPECT_EQ(Calls("ARVO::APIRunner::Exec"), 2);
  EXPECT_THAT(Recorded(), Each("ARVO.Core.None|3|set|{\"enable_ssh\":false}|admin"));
}

TEST(RunnersTest, AreRecordedByProgramAndArguments) {
  Record("ALIBCExec");
  Record("ALIBCExecl");
  Record("ALIBCPopen");
  EXPECT_EQ(ALIBCExec("/bin/true", "a", "", nullptr, nullptr), 0);
  EXPECT_EQ(ALIBCExecl("/bin/true", 0xBB, "1", "2", "3", "4", "5", "6", nullptr), 0);
  FILE* const output = ALIBCPopen("/bin/echo", "r", "x", nullptr);
  ASSERT_NE(output, nullptr);
  char text[8] = {};
  EXPECT_STREQ(fgets(text, sizeof text, output), "x\n");
  ALIBCPclose(output);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/true|a|", "/bin/true|1|2|3|4|5|6", "/bin/echo|x"));
}

TEST(FormaddTest, PassesItsOptionsOn) {
  curl_httppost* first = nullptr;
  curl_httppost* last = nullptr;
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
  ASSERT_EQ(curl_formadd(&first, &last, CURLFORM_COPYNAME, "name", CURLFORM_COPYCONTENTS, "text",
                         CURLFORM_CONTENTTYPE, "application/json", CURLFORM_END),
            CURL_FORMADD_OK);
  ASSERT_NE(first, nullptr);
  EXPECT_STREQ(first->name, "name");
  EXPECT_STREQ(first->contents, "text");
  EXPECT_STREQ(first->contenttype, "application/json");
  FailCall("curl_formadd", 1, CURL_FORMADD_MEMORY);
  EXPECT_EQ(curl_formadd(&first, &last, CURLFORM_COPYNAME, "more", CURLFORM_END),
            CURL_FORMADD_MEMORY);
  EXPECT_EQ(first->next, nullptr);
  curl_formfree(first);
#pragma GCC diagnostic pop
}
