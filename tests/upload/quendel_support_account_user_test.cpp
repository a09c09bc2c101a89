// The support account: its home, its key, its end.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <pwd.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kUnit[] = "quendel_support_account_user";
constexpr char kHome[] = "/run/quendelhome";
constexpr char kSshDir[] = "/run/quendelhome/.ssh";
constexpr char kKeyFile[] = "/run/quendelhome/.ssh/authorized_keys";
constexpr char kKey[] = "ssh-ed25519 AAAAC3Nza support@vendor";

struct stat Status(const char* path) {
  struct stat status = {};
  EXPECT_EQ(lstat(path, &status), 0) << path;
  return status;
}

unsigned int Mode(const char* path) {
  return Status(path).st_mode & 07777U;
}

bool HasAccount(const char* name) {
  setpwent();  // read the file anew
  return getpwnam(name) != nullptr;
}

void MakeSshDir() {
  ASSERT_EQ(mkdir(kHome, 0755), 0);
  ASSERT_EQ(mkdir(kSshDir, 0755), 0);
}

// Makes the account, which must fail because its key file is not opened.
void ExpectKeyFileNotOpened() {
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to open '/run/quendelhome/.ssh/authorized_keys'")));
}

}  // namespace

// ---- Creating it.

TEST(SupportAccountUserCreateTest, PreparesHomeAccountAndKey) {
  umask(022);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_THAT(Log(), IsEmpty());
  EXPECT_EQ(Status(kHome).st_uid, 50001U);
  EXPECT_EQ(Status(kHome).st_gid, 100U);
  EXPECT_EQ(Status(kSshDir).st_uid, 0U);  // the home alone changes hands
  EXPECT_EQ(Status(kKeyFile).st_uid, 0U);
  EXPECT_EQ(Mode(kSshDir), 0755U);
  EXPECT_EQ(Mode(kKeyFile), 0644U);
  EXPECT_EQ(ReadFile(kKeyFile), kKey);  // no line end is added
  EXPECT_TRUE(HasAccount("support"));
}

TEST(SupportAccountUserCreateTest, KeyIsReadableWhateverTheUmask) {
  umask(077);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(Mode(kKeyFile), 0644U);
}

TEST(SupportAccountUserCreateTest, MakesTheSshDirOnlyWhenItIsMissing) {
  Record("ALIBCExec");
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/mkdir|-p|/run/quendelhome/.ssh|-m|755"));
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(Recorded().size(), 1U);
}

TEST(SupportAccountUserCreateTest, MakesTheSshDirInAHomeThatIsThere) {
  ASSERT_EQ(mkdir(kHome, 0755), 0);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(ReadFile(kKeyFile), kKey);
}

TEST(SupportAccountUserCreateTest, SetsTheOwnerOfAHomeThatIsThere) {
  MakeSshDir();
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(Status(kHome).st_uid, 50001U);
  ASSERT_EQ(chown(kHome, 0, 0), 0);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(Status(kHome).st_uid, 50001U);
}

TEST(SupportAccountUserCreateTest, ReplacesTheKey) {
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", "a key that is longer\n"), 0);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", "shorter\n"), 0);
  EXPECT_EQ(ReadFile(kKeyFile), "shorter\n");
}

TEST(SupportAccountUserCreateTest, WritesAnEmptyKey) {
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", ""), 0);
  EXPECT_TRUE(Exists(kKeyFile));
  EXPECT_EQ(ReadFile(kKeyFile), "");
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserCreateTest, FailsWhenMkdirCannotRun) {
  On("ALIBCExec").Nth(1).Return(-1, ENOENT);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to mkdir '/run/quendelhome/.ssh'\n")));
  EXPECT_EQ(Calls("ARVOLocalAccountUserPrepareForQuendel"), 0);
}

TEST(SupportAccountUserCreateTest, PassesOverADirThatSomeoneElseMadeMeanwhile) {
  MakeSshDir();
  On("ALIBCFileCheckDir").Nth(1).Return(0);
  On("ALIBCExec").Nth(1).Return(-1, EEXIST);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserCreateTest, GoesOnWhenItCannotTellWhetherTheDirIsThere) {
  MakeSshDir();
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(Calls("ALIBCExec"), 0);
}

TEST(SupportAccountUserCreateTest, FailsWhenTheHomeCannotChangeHands) {
  On("chown").Nth(1).Return(-1, EPERM);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to chown '/run/quendelhome'")));
  EXPECT_FALSE(HasAccount("support"));
}

TEST(SupportAccountUserCreateTest, FailsWhenMkdirRanButMadeNothing) {
  On("ALIBCExec").Nth(1).Return(1);  // its exit status is nobody's concern; the home is missing
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to chown '/run/quendelhome'")));
}

TEST(SupportAccountUserCreateTest, FailsWhenTheAccountCannotBePrepared) {
  for (const long result : {-1L, -2L}) {
    ClearLog();
    On("ARVOLocalAccountUserPrepareForQuendel").Nth(1).Return(result);
    EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1) << result;
    EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to prepare local account 'support'")));
    EXPECT_FALSE(Exists(kKeyFile));
  }
}

TEST(SupportAccountUserCreateTest, TakesAnyResultButANegativeOneForPrepared) {
  On("ARVOLocalAccountUserPrepareForQuendel").Nth(1).Return(1);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(ReadFile(kKeyFile), kKey);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserCreateTest, FailsWhenTheKeyFileCannotBeOpened) {
  MakeSshDir();
  ASSERT_EQ(mkdir(kKeyFile, 0755), 0);
  ExpectKeyFileNotOpened();
}

TEST(SupportAccountUserCreateTest, FollowsNoLinkInPlaceOfTheKeyFile) {
  MakeSshDir();
  WriteFile("/tmp/shadow", "theirs");
  ASSERT_EQ(symlink("/tmp/shadow", kKeyFile), 0);
  ExpectKeyFileNotOpened();
  EXPECT_EQ(ReadFile("/tmp/shadow"), "theirs");
}

TEST(SupportAccountUserCreateTest, FollowsNoLinkInPlaceOfTheSshDir) {
  ASSERT_EQ(mkdir(kHome, 0755), 0);
  ASSERT_EQ(mkdir("/tmp/elsewhere", 0755), 0);
  ASSERT_EQ(symlink("/tmp/elsewhere", kSshDir), 0);
  ExpectKeyFileNotOpened();
  EXPECT_FALSE(Exists("/tmp/elsewhere/authorized_keys"));
}

TEST(SupportAccountUserCreateTest, DoesNotWaitForTheReaderOfAFifo) {
  MakeSshDir();
  ASSERT_EQ(mkfifo(kKeyFile, 0644), 0);
  ExpectKeyFileNotOpened();
}

TEST(SupportAccountUserCreateTest, RefusesAFifoThatIsRead) {
  MakeSshDir();
  ASSERT_EQ(mkfifo(kKeyFile, 0644), 0);
  const int reader = open(kKeyFile, O_RDONLY | O_NONBLOCK);
  ASSERT_GE(reader, 0);
  ExpectKeyFileNotOpened();
  char byte = 0;
  EXPECT_EQ(read(reader, &byte, 1), 0);  // nobody wrote the key
}

TEST(SupportAccountUserCreateTest, LeavesAFileAloneThatHasAnotherName) {
  MakeSshDir();
  WriteFile("/run/other", "theirs");
  ASSERT_EQ(link("/run/other", kKeyFile), 0);
  ExpectKeyFileNotOpened();
  EXPECT_EQ(ReadFile("/run/other"), "theirs");
}

TEST(SupportAccountUserCreateTest, FailsWhenTheKeyCannotBeWritten) {
  MakeSshDir();
  // A file may not grow at all, as on a full disk.
  signal(SIGXFSZ, SIG_IGN);
  On("ARVOLocalAccountUserPrepareForQuendel").Nth(1).Return(0);
  const rlimit none = {0, RLIM_INFINITY};
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &none), 0);
  const int result = QUENDELSupportAccountUserCreate("support", kKey);
  const rlimit any = {RLIM_INFINITY, RLIM_INFINITY};
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &any), 0);
  EXPECT_EQ(result, -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(
                         kUnit, "Failed to update '/run/quendelhome/.ssh/authorized_keys'")));
  EXPECT_EQ(Calls("fchmod"), 0);
}

TEST(SupportAccountUserCreateTest, FailsWhenTheModeCannotBeSet) {
  umask(0);
  On("fchmod").Nth(1).Return(-1, EROFS);
  EXPECT_EQ(QUENDELSupportAccountUserCreate("support", kKey), -1);
  EXPECT_EQ(Mode(kKeyFile), 0666U);  // as any new file has it
  EXPECT_THAT(
      Log(), ElementsAre(Logged(kUnit, "Failed to chmod '/run/quendelhome/.ssh/authorized_keys'")));
}

// ---- Deleting it.

TEST(SupportAccountUserDeleteTest, RemovesHomeAndAccount) {
  ASSERT_EQ(QUENDELSupportAccountUserCreate("support", kKey), 0);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("support"), 0);
  EXPECT_FALSE(Exists(kHome));
  EXPECT_FALSE(HasAccount("support"));
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserDeleteTest, RemovesTheHomeOnlyWhenItIsADirectory) {
  Record("ALIBCExec");
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  WriteFile(kHome, "a file");
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_THAT(Recorded(), IsEmpty());
  RemoveFile(kHome);
  MakeSshDir();
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_THAT(Recorded(), ElementsAre("/bin/rm|-f|-r|/run/quendelhome"));
}

TEST(SupportAccountUserDeleteTest, LeavesAHomeThatItCannotTellToBeOne) {
  MakeSshDir();
  On("ALIBCFileCheckDir").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_TRUE(Exists(kSshDir));
}

TEST(SupportAccountUserDeleteTest, AccountThatIsGoneCountsAsDeleted) {
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_EQ(Calls("ALIBCMResultCoreErrorsGet"), 1);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserDeleteTest, AsksForTheErrorCodesAfterAnyNegativeResult) {
  for (const long result : {-1L, -2L}) {
    ResetCalls();
    On("ARVOLocalAccountUserDelete").Nth(1).Return(result);
    EXPECT_EQ(QUENDELSupportAccountUserDelete("support"), -1) << result;
    EXPECT_EQ(Calls("ALIBCMResultCoreErrorsGet"), 1);
  }
}

TEST(SupportAccountUserDeleteTest, TakesAnyOtherResultForDeleted) {
  for (const long result : {0L, 1L}) {
    ResetCalls();
    On("ARVOLocalAccountUserDelete").Nth(1).Return(result);
    EXPECT_EQ(QUENDELSupportAccountUserDelete("support"), 0) << result;
    EXPECT_EQ(Calls("ALIBCMResultCoreErrorsGet"), 0);
  }
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(SupportAccountUserDeleteTest, FailsWhenTheHomeCannotBeRemoved) {
  MakeSshDir();
  On("ALIBCExec").Nth(1).Return(-1);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("support"), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to remove '/run/quendelhome'")));
  EXPECT_EQ(Calls("ARVOLocalAccountUserDelete"), 0);
  EXPECT_EQ(Calls("ALIBCMResultFree"), 1);
}

TEST(SupportAccountUserDeleteTest, FailsWhenThereIsNoErrorCode) {
  On("ALIBCMResultCoreErrorsGet").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "ALIBCMResultCoreErrorsGet fail")));
}

TEST(SupportAccountUserDeleteTest, FailsOnAnyOtherErrorCode) {
  static const int other[] = {7425};
  On("ALIBCMResultCoreErrorsGet").Nth(1).Return(other);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Failed to delete local account 'nobody-there'\n")));
}

TEST(SupportAccountUserDeleteTest, GoesByTheFirstErrorCode) {
  static const int first[] = {7424, 7425};
  On("ALIBCMResultCoreErrorsGet").Nth(1).Return(first);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
}

TEST(SupportAccountUserDeleteTest, FreesTheResultOnEveryPath) {
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_EQ(Calls("ALIBCMResultAlloc"), 1);
  EXPECT_EQ(Calls("ALIBCMResultFree"), 1);
  On("ARVOLocalAccountUserDelete").Nth(1).Return(0);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), 0);
  EXPECT_EQ(Calls("ALIBCMResultFree"), 2);
  On("ALIBCMResultCoreErrorsGet").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), -1);
  EXPECT_EQ(Calls("ALIBCMResultFree"), 3);
}

TEST(SupportAccountUserDeleteTest, BearsAResultThatCouldNotBeMade) {
  On("ALIBCMResultAlloc").Nth(1).Return(nullptr);
  EXPECT_EQ(QUENDELSupportAccountUserDelete("nobody-there"), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "ALIBCMResultCoreErrorsGet fail")));
}
