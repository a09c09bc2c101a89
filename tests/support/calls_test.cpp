// Calls that are counted, recorded, or end in another way.
#include "support/calls.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/shm.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>

#include "base/owned_fd.h"
#include "platform/api_runner.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "platform/process.h"
#include "quendel.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kFile[] = "/tmp/file";

}  // namespace

TEST(OnTest, FailsTheNthCallFromNowOn) {
  WriteFile(kFile, "");
  EXPECT_EQ(chmod(kFile, 0600), 0);
  On("chmod").Nth(2).Return(-1, EIO);
  EXPECT_EQ(chmod(kFile, 0601), 0);
  errno = 0;
  EXPECT_EQ(chmod(kFile, 0602), -1);
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(chmod(kFile, 0603), 0);
}

TEST(OnTest, KeepsAFailedCallFromDoingItsWork) {
  WriteFile(kFile, "");
  ASSERT_EQ(chmod(kFile, 0600), 0);
  On("chmod").Nth(1).Return(-1);
  ASSERT_EQ(chmod(kFile, 0644), -1);
  struct stat status = {};
  stat(kFile, &status);
  EXPECT_EQ(status.st_mode & 07777, 0600U);
}

TEST(OnTest, FailsEachCallForZero) {
  On("chmod").Return(-7);
  for (int i = 0; i < 5; ++i) {
    EXPECT_EQ(chmod("/", 0755), -7);
  }
}

TEST(OnTest, LeavesErrnoAloneWithoutANumberForIt) {
  On("chmod").Nth(1).Return(-1);
  errno = EAGAIN;
  chmod("/", 0755);
  EXPECT_EQ(errno, EAGAIN);
}

TEST(OnTest, TakesSeveralFaultsOfOneFunction) {
  On("ALIBCFileExist").Nth(1).Return(11);
  On("ALIBCFileExist").Nth(3).Return(33);
  EXPECT_EQ(ALIBCFileExist("/"), 11);
  EXPECT_EQ(ALIBCFileExist("/"), 1);
  EXPECT_EQ(ALIBCFileExist("/"), 33);
}

TEST(OnTest, ReturnsPointers) {
  On("calloc").Nth(1).Return(nullptr);
  On("shmat").Nth(1).Return(-1);
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  On("curl_easy_init").Nth(1).Return(nullptr);
  void* memory = calloc(1, 20256);
  EXPECT_EQ(memory, nullptr);
  free(memory);
  EXPECT_EQ(shmat(0, nullptr, 0), reinterpret_cast<void*>(-1));
  EXPECT_EQ(platform::OwnedHash(1).get(), nullptr);
  EXPECT_EQ(curl_easy_init(), nullptr);
}

TEST(OnTest, ReturnsCurlCodes) {
  CURL* handle = curl_easy_init();
  On("curl_easy_setopt").Nth(2).Return(CURLE_UNKNOWN_OPTION);
  EXPECT_EQ(curl_easy_setopt(handle, CURLOPT_URL, "https://x"), CURLE_OK);
  EXPECT_EQ(curl_easy_setopt(handle, CURLOPT_PORT, 51790L), CURLE_UNKNOWN_OPTION);
  On("curl_easy_perform").Nth(1).Return(CURLE_RECV_ERROR);
  EXPECT_EQ(curl_easy_perform(handle), CURLE_RECV_ERROR);
  On("curl_easy_getinfo").Nth(1).Return(CURLE_BAD_FUNCTION_ARGUMENT);
  long status = 7;
  EXPECT_EQ(curl_easy_getinfo(handle, CURLINFO_RESPONSE_CODE, &status),
            CURLE_BAD_FUNCTION_ARGUMENT);
  EXPECT_EQ(status, 7);
  curl_easy_cleanup(handle);
}

TEST(OnTest, ReachesForkedChildrenInTheirOwnCount) {
  On("chmod").Nth(2).Return(-1);
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

TEST(OnTest, IsAboutCallsWithAnArgument) {
  WriteFile(kFile, "");
  WriteFile("/tmp/other", "");
  On("chmod").With(kFile).Return(-1);
  On("chmod").With(0111).Return(-2);
  On("rename").With("/tmp/a").With(testing::HasSubstr("/b")).Return(-3);
  EXPECT_EQ(chmod("/tmp/other", 0600), 0);
  EXPECT_EQ(chmod(kFile, 0600), -1);
  EXPECT_EQ(chmod("/tmp/other", 0111), -2);
  EXPECT_EQ(rename("/tmp/a", "/tmp/b"), -3);
  EXPECT_EQ(rename("/tmp/a", "/tmp/c"), -1);
}

TEST(OnTest, CountsOnlyTheCallsThatItIsAbout) {
  WriteFile(kFile, "");
  On("chmod").With(kFile).Nth(2).Return(-1);
  EXPECT_EQ(chmod(kFile, 0600), 0);
  EXPECT_EQ(chmod("/tmp", 01777), 0);
  EXPECT_EQ(chmod(kFile, 0600), -1);
  EXPECT_EQ(chmod(kFile, 0600), 0);
}

TEST(OnTest, KnowsAnOpenFileByItsPath) {
  WriteFile(kFile, "text");
  WriteFile("/tmp/other", "text");
  const quendel::OwnedFd file(open(kFile, O_RDONLY));
  const quendel::OwnedFd other(open("/tmp/other", O_RDONLY));
  char byte = 0;
  On("pread").With(kFile).Return(-1, EIO);
  EXPECT_EQ(pread(file.get(), &byte, 1, 0), -1);
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(pread(other.get(), &byte, 1, 0), 1);
}

TEST(OnTest, AsksWhetherItHolds) {
  bool holds = false;
  On("chmod").When([&] { return holds; }).Return(-1);
  EXPECT_EQ(chmod("/tmp", 01777), 0);
  holds = true;
  EXPECT_EQ(chmod("/tmp", 01777), -1);
}

TEST(OnTest, LetsTheLastRuleThatIsAboutACallDecide) {
  On("chmod").Return(-1);
  On("chmod").Nth(2).Return(-2);
  On("chmod").With("/elsewhere").Return(-3);
  EXPECT_EQ(chmod("/tmp", 01777), -1);
  EXPECT_EQ(chmod("/tmp", 01777), -2);
  EXPECT_EQ(chmod("/tmp", 01777), -1);
}

TEST(OnTest, HasSomethingHappenBeforeTheCall) {
  On("chmod").Before([] { WriteFile(kFile, ""); });
  EXPECT_EQ(chmod(kFile, 0600), 0);
  On("unlink").Before([] { RemoveFile(kFile); }).Return(-7);
  EXPECT_EQ(unlink(kFile), -7);
  EXPECT_FALSE(Exists(kFile));
}

TEST(OnTest, ShortensWhatIsAskedFor) {
  WriteFile(kFile, "0123456789");
  const quendel::OwnedFd file(open(kFile, O_RDONLY));
  char bytes[10] = {};
  On("pread").Shorten(7);
  EXPECT_EQ(pread(file.get(), bytes, sizeof bytes, 0), 7);
  EXPECT_EQ(pread(file.get(), bytes, 3, 0), 3);
}

TEST(OnTest, CallsAnotherFunctionThatMayMakeTheCall) {
  WriteFile(kFile, "");
  On("stat").Replace([](const char* path, struct stat* status) {
    const int result = stat(path, status);
    status->st_ino = 7;
    return result + 1;
  });
  struct stat status = {};
  EXPECT_EQ(stat(kFile, &status), 1);
  EXPECT_EQ(status.st_ino, 7U);
  EXPECT_EQ(Calls("stat"), 1);
}

TEST(OnTest, LetsExceptionsThrough) {
  On("QUENDELCollectLog").Replace([](const char*) -> int { throw 7; });
  EXPECT_THROW(QUENDELCollectLog("/tmp"), int);
}

TEST(OnTest, TellsThePlatformsCallsFromTheLibrarys) {
  struct stat status = {};
  On("stat").InPlatform().Return(-1, ENOENT);
  EXPECT_EQ(stat("/tmp", &status), 0);
  EXPECT_EQ(ALIBCFileExist("/tmp"), 0);
  On("stat").Anywhere().Return(-1, ENOENT);
  EXPECT_EQ(stat("/tmp", &status), -1);
  EXPECT_EQ(ALIBCFileExist("/tmp"), 0);
}

TEST(OnDeathTest, RefusesAnotherSignature) {
  struct stat status = {};
  On("stat").Replace([](const char*) { return 0; });
  EXPECT_DEATH(stat("/tmp", &status), "a function is replaced by one with another signature");
}

TEST(RestoreTest, ForgetsTheRulesOfOneFunction) {
  On("chmod").Return(-1);
  On("chown").Return(-2);
  Restore("chmod");
  EXPECT_EQ(chmod("/tmp", 01777), 0);
  EXPECT_EQ(chown("/tmp", 0, 0), -2);
}

TEST(SetClockTest, ShowsThisTime) {
  SetClock(1709622489);
  EXPECT_EQ(time(nullptr), 1709622489);
  EXPECT_EQ(time(nullptr), 1709622489);
}

TEST(OnDeathTest, RefusesAFunctionThatIsNotWrapped) {
  EXPECT_DEATH(On("no_such_function").Nth(1).Return(0),
               "calls of no_such_function are not wrapped");
  EXPECT_DEATH(On("no_such").InPlatform().Nth(1).Return(0), "calls of no_such are not wrapped");
  EXPECT_DEATH(Calls("no_such_function"), "not wrapped");
  EXPECT_DEATH(Record("no_such_function"), "not wrapped");
}

TEST(CallsTest, CountsEveryCall) {
  On("chmod").Nth(2).Return(-1);
  for (int i = 0; i < 3; ++i) {
    chmod("/tmp", 01777);
  }
  EXPECT_EQ(Calls("chmod"), 3);
  EXPECT_EQ(Calls("chown"), 0);
}

TEST(CallsTest, CountsThePlatformsOwnCallsApart) {
  SetIdentity();
  On("rename").Nth(1).Return(-1);
  ASSERT_GT(ALIBCFileSetKeyValue("/usr/arvo/etc/device.conf", "timezone", "UTC", 0), 0);
  EXPECT_EQ(Calls("rename"), 0);
  EXPECT_EQ(CallsInPlatform("rename"), 1);
  EXPECT_EQ(Calls("ALIBCFileSetKeyValue"), 1);
  EXPECT_EQ(rename("/tmp/a", "/tmp/b"), -1);
}

TEST(CallsTest, LetsThePlatformsOwnCallsFail) {
  SetIdentity();
  const std::string before = ReadFile("/usr/arvo/etc/device.conf");
  On("rename").InPlatform().Nth(1).Return(-1, EIO);
  EXPECT_LT(ALIBCFileSetKeyValue("/usr/arvo/etc/device.conf", "timezone", "UTC", 0), 0);
  EXPECT_EQ(ReadFile("/usr/arvo/etc/device.conf"), before);
}

TEST(ResetCallsTest, ForgetsEverything) {
  Record("chmod");
  On("chmod").Nth(2).Return(-1);
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
  On("sleep").Before([&runs] { ++runs; });
  sleep(1);
  sleep(5);
  EXPECT_EQ(runs, 2);
  Restore("sleep");
  sleep(1);
  EXPECT_EQ(runs, 2);
}

TEST(SleepTest, CanBeInterrupted) {
  On("sleep").Nth(1).Return(4);
  EXPECT_EQ(sleep(9), 4U);
}

TEST(ApiRunnerTest, IsRecordedAndFailsUnderItsOwnName) {
  Record("ARVO::APIRunner::Exec");
  On("ARVO::APIRunner::Exec").Nth(1).Return(0);
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
  On("curl_formadd").Nth(1).Return(CURL_FORMADD_MEMORY);
  EXPECT_EQ(curl_formadd(&first, &last, CURLFORM_COPYNAME, "more", CURLFORM_END),
            CURL_FORMADD_MEMORY);
  EXPECT_EQ(first->next, nullptr);
  curl_formfree(first);
#pragma GCC diagnostic pop
}
