// The device's own accounts and the result record.
#include "platform/local_account.h"

#include <dirent.h>
#include <gmock/gmock.h>
#include <pwd.h>
#include <shadow.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>
#include <thread>
#include <vector>

#include "platform/error.h"
#include "platform/process.h"
#include "support/appliance.h"
#include "support/calls.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::Not;

// Ends each look at the list of processes.

namespace {

constexpr uid_t kSupportUid = 50001;

// Owns a result record.
class Result {
 public:
  Result() : record_(ALIBCMResultAlloc()) {}
  ~Result() { ALIBCMResultFree(record_); }
  ALIBCMRESULT* get() const { return record_; }
  // The first core error code, or 0 when there is none.
  int FirstError() const {
    const int* const code = ALIBCMResultCoreErrorsGet(record_);
    return code == nullptr ? 0 : *code;
  }

 private:
  ALIBCMRESULT* record_;
};

int Prepare(const char* user) {
  return ARVOLocalAccountUserPrepareForQuendel(user, 5);
}

int Delete(const char* user, const Result& result) {
  return ARVOLocalAccountUserDelete(&user, 1, result.get());
}

bool AccountExists(const char* user) {
  return getpwnam(user) != nullptr;
}

// Expects the account to be as the support account must be.
void ExpectSupportAccount(const char* user) {
  const passwd* const entry = getpwnam(user);
  ASSERT_NE(entry, nullptr);
  EXPECT_EQ(entry->pw_uid, kSupportUid);
  EXPECT_EQ(entry->pw_gid, 100U);
  EXPECT_STREQ(entry->pw_dir, "/run/quendelhome");
  EXPECT_STREQ(entry->pw_shell, "/bin/sh");
  const spwd* const shadow = getspnam(user);
  ASSERT_NE(shadow, nullptr);
  EXPECT_STREQ(shadow->sp_pwdp, "*");
  EXPECT_EQ(shadow->sp_expire, -1);
}

void PauseForEver() {
  for (;;) {
    pause();
  }
}

// A process of a user.
pid_t StartAs(uid_t uid, void (*body)()) {
  int ready[2];
  EXPECT_EQ(pipe(ready), 0);
  const pid_t child = fork();
  if (child == 0) {
    if (setresuid(uid, uid, uid) != 0) {
      _exit(1);
    }
    close(ready[0]);
    close(ready[1]);
    body();
  }
  close(ready[1]);
  char byte;
  EXPECT_EQ(read(ready[0], &byte, 1), 0);  // the child has its user
  close(ready[0]);
  return child;
}

// Returns the signal that ended a process: SIGTERM, which it gets here, when none came before.
int EndOf(pid_t process) {
  kill(process, SIGTERM);
  int status = 0;
  EXPECT_EQ(waitpid(process, &status, 0), process);
  return WIFSIGNALED(status) ? WTERMSIG(status) : 0;
}

void AwaitEndOfFirstThread(pid_t process) {
  const std::string status = "/proc/" + std::to_string(process) + "/status";
  while (ReadFile(status).find("\nState:\tZ") == std::string::npos) {
    std::this_thread::yield();
  }
}

}  // namespace

TEST(LocalAccountUserPrepareTest, MakesTheSupportAccount) {
  EXPECT_EQ(Prepare("support1"), 0);
  ExpectSupportAccount("support1");
}

TEST(LocalAccountUserPrepareTest, MakesNeitherHomeNorGroup) {
  EXPECT_EQ(Prepare("support1"), 0);
  EXPECT_FALSE(Exists("/run/quendelhome"));
  EXPECT_THAT(ReadFile("/etc/group"), Not(HasSubstr("support1")));
}

TEST(LocalAccountUserPrepareTest, LeavesAHomeThatIsThere) {
  WriteFile("/run/quendelhome/.ssh/authorized_keys", "key");
  EXPECT_EQ(Prepare("support1"), 0);
  EXPECT_EQ(ReadFile("/run/quendelhome/.ssh/authorized_keys"), "key");
}

TEST(LocalAccountUserPrepareTest, TakesAnAccountThatIsReady) {
  EXPECT_EQ(Prepare("support1"), 0);
  EXPECT_EQ(Prepare("support1"), 0);
  ExpectSupportAccount("support1");
}

TEST(LocalAccountUserPrepareTest, RestoresAnAccountThatWasChanged) {
  WriteFile("/tmp/change",
            "#!/bin/sh -e\nuseradd -M -N -u 50001 -d /nowhere -s /bin/false support1\n"
            "usermod -e 2001-01-01 -p '!' support1\n");
  chmod("/tmp/change", 0755);
  ASSERT_EQ(ALIBCExecl("/tmp/change", 187, nullptr), 0);
  EXPECT_EQ(Prepare("support1"), 0);
  ExpectSupportAccount("support1");
}

TEST(LocalAccountUserPrepareTest, RefusesAnAccountOfSomebodyElse) {
  const std::string before = ReadFile("/etc/passwd");
  EXPECT_LT(Prepare("root"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0b00);
  EXPECT_LT(Prepare("daemon"), 0);
  EXPECT_EQ(ReadFile("/etc/passwd"), before);
}

TEST(LocalAccountUserPrepareTest, RefusesNamesThatAreNone) {
  const std::string before = ReadFile("/etc/passwd");
  for (const char* name : {"", "-r", "1abc", "a b", "a:b", "a\nb", "../a", "A", "a;id", "\xC3\xA4",
                           "a.b", "abcdefghijklmnopqrstuvwxyz0123456"}) {
    EXPECT_LT(Prepare(name), 0) << name;
    EXPECT_EQ(ALIBCErrGet(), 0x0100);
  }
  EXPECT_LT(Prepare(nullptr), 0);
  EXPECT_EQ(ReadFile("/etc/passwd"), before);
}

TEST(LocalAccountUserPrepareTest, TakesTheLongestName) {
  EXPECT_EQ(Prepare("_bcdefghijklmnopqrstuvwxyz-12345"), 0);
  ExpectSupportAccount("_bcdefghijklmnopqrstuvwxyz-12345");
}

TEST(LocalAccountUserPrepareTest, RefusesAnotherKind) {
  EXPECT_LT(ARVOLocalAccountUserPrepareForQuendel("support1", 4), 0);
  EXPECT_FALSE(AccountExists("support1"));
}

TEST(LocalAccountUserPrepareTest, FailsWhenTheIdIsTaken) {
  EXPECT_EQ(Prepare("support1"), 0);
  EXPECT_LT(Prepare("support2"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0b01);
  EXPECT_FALSE(AccountExists("support2"));
}

TEST(LocalAccountUserPrepareTest, FailsWithoutTheTool) {
  RemoveFile("/usr/sbin/useradd");
  EXPECT_LT(Prepare("support1"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0b01);
}

TEST(LocalAccountUserPrepareTest, FailsWhenTheAccountCannotBeRestored) {
  EXPECT_EQ(Prepare("support1"), 0);
  RemoveFile("/usr/sbin/usermod");
  EXPECT_LT(Prepare("support1"), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0b01);
}

TEST(LocalAccountUserDeleteTest, DeletesTheSupportAccount) {
  ASSERT_EQ(Prepare("support1"), 0);
  WriteFile("/run/quendelhome/file", "kept");
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_FALSE(AccountExists("support1"));
  EXPECT_EQ(result.FirstError(), 0);
  EXPECT_EQ(ReadFile("/run/quendelhome/file"), "kept");
}

TEST(LocalAccountUserDeleteTest, DeletesAnyOrdinaryAccount) {
  ASSERT_EQ(ALIBCExecl("/usr/sbin/useradd", 187, "-M", "-u", "1234", "someone", nullptr), 0);
  Result result;
  EXPECT_EQ(Delete("someone", result), 0);
  EXPECT_FALSE(AccountExists("someone"));
}

TEST(LocalAccountUserDeleteTest, TellsAnUnknownAccountByItsCode) {
  Result result;
  EXPECT_LT(Delete("nobody-here", result), 0);
  EXPECT_EQ(result.FirstError(), 7424);
  EXPECT_EQ(ALIBCErrGet(), 7424);
}

TEST(LocalAccountUserDeleteTest, RefusesAccountsOfTheSystem) {
  const std::string before = ReadFile("/etc/passwd");
  for (const char* name : {"root", "daemon", "sshd", "nobody"}) {
    Result result;
    EXPECT_LT(Delete(name, result), 0) << name;
    EXPECT_EQ(result.FirstError(), 0x0b00);
  }
  EXPECT_EQ(ReadFile("/etc/passwd"), before);
}

TEST(LocalAccountUserDeleteTest, RefusesNamesThatAreNone) {
  for (const char* name : {"", "-r", "a b", "--help"}) {
    Result result;
    EXPECT_LT(Delete(name, result), 0) << name;
    EXPECT_EQ(result.FirstError(), 0x0100);
  }
  Result result;
  EXPECT_LT(Delete(nullptr, result), 0);
  EXPECT_EQ(result.FirstError(), 0x0100);
}

TEST(LocalAccountUserDeleteTest, TriesEveryName) {
  ASSERT_EQ(Prepare("support1"), 0);
  const char* const names[] = {"unknown", "support1", "root"};
  Result result;
  EXPECT_LT(ARVOLocalAccountUserDelete(names, 3, result.get()), 0);
  EXPECT_FALSE(AccountExists("support1"));
  const int* const errors = ALIBCMResultCoreErrorsGet(result.get());
  ASSERT_NE(errors, nullptr);
  EXPECT_EQ(errors[0], 7424);
  EXPECT_EQ(errors[1], 0x0b00);
}

TEST(LocalAccountUserDeleteTest, ForgetsTheErrorsOfAnEarlierCall) {
  ASSERT_EQ(Prepare("support1"), 0);
  Result result;
  EXPECT_LT(Delete("unknown", result), 0);
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_EQ(ALIBCMResultCoreErrorsGet(result.get()), nullptr);
}

TEST(LocalAccountUserDeleteTest, EndsSessionsThatAreStillOpen) {
  ASSERT_EQ(Prepare("support1"), 0);
  const pid_t session = StartAs(kSupportUid, PauseForEver);
  const pid_t other = StartAs(50002, PauseForEver);
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_FALSE(AccountExists("support1"));
  EXPECT_EQ(EndOf(session), SIGKILL);
  EXPECT_EQ(EndOf(other), SIGTERM);
}

// As when a session forks while the list of processes is read.
TEST(LocalAccountUserDeleteTest, EndsSessionsThatBeginMeanwhile) {
  ASSERT_EQ(Prepare("support1"), 0);
  const pid_t session = StartAs(kSupportUid, PauseForEver);
  pid_t late = 0;
  On("closedir").InPlatform().Nth(1).Before([&] { late = StartAs(kSupportUid, PauseForEver); });
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_EQ(EndOf(session), SIGKILL);
  ASSERT_GT(late, 0);
  EXPECT_EQ(EndOf(late), SIGKILL);
}

TEST(LocalAccountUserDeleteTest, DoesNotWaitForProcessesThatHaveEnded) {
  ASSERT_EQ(Prepare("support1"), 0);
  const pid_t session = StartAs(kSupportUid, [] { _exit(0); });
  AwaitEndOfFirstThread(session);
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_EQ(CallsInPlatform("closedir"), 1);
  EXPECT_EQ(EndOf(session), 0);
}

TEST(LocalAccountUserDeleteTest, EndsAProcessWhoseFirstThreadHasEnded) {
  ASSERT_EQ(Prepare("support1"), 0);
  const pid_t session = StartAs(kSupportUid, [] {
    std::thread(PauseForEver).detach();
    syscall(SYS_exit, 0);
  });
  AwaitEndOfFirstThread(session);
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_EQ(EndOf(session), SIGKILL);
}

TEST(LocalAccountUserDeleteTest, GivesUpOnSessionsThatDoNotEnd) {
  ASSERT_EQ(Prepare("support1"), 0);
  const pid_t session = StartAs(kSupportUid, PauseForEver);
  On("kill").InPlatform().Return(-1, EPERM);
  Result result;
  EXPECT_EQ(Delete("support1", result), 0);
  EXPECT_EQ(CallsInPlatform("closedir"), 10);
  EXPECT_EQ(EndOf(session), SIGTERM);
}

TEST(LocalAccountUserDeleteTest, FailsWithoutTheTool) {
  ASSERT_EQ(Prepare("support1"), 0);
  RemoveFile("/usr/sbin/userdel");
  Result result;
  EXPECT_LT(Delete("support1", result), 0);
  EXPECT_EQ(result.FirstError(), 0x0b01);
  EXPECT_TRUE(AccountExists("support1"));
}

TEST(LocalAccountUserDeleteTest, RefusesOtherArguments) {
  const char* name = "unknown";
  Result result;
  EXPECT_LT(ARVOLocalAccountUserDelete(nullptr, 1, result.get()), 0);
  EXPECT_LT(ARVOLocalAccountUserDelete(&name, -1, result.get()), 0);
  EXPECT_LT(ARVOLocalAccountUserDelete(&name, 1, nullptr), 0);
  EXPECT_EQ(result.FirstError(), 0);
  EXPECT_EQ(ARVOLocalAccountUserDelete(&name, 0, result.get()), 0);
}

TEST(MResultTest, StartsWithoutErrors) {
  Result result;
  ASSERT_NE(result.get(), nullptr);
  EXPECT_EQ(ALIBCMResultCoreErrorsGet(result.get()), nullptr);
  EXPECT_EQ(ALIBCMResultCoreErrorsGet(nullptr), nullptr);
  ALIBCMResultFree(nullptr);
}
