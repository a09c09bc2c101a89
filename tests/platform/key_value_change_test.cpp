// Changing key-value files: what is kept, and what others, a crash or a full disk leave of it.
#include <dirent.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/random.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr int kPollMilliseconds = 2;
constexpr char kDir[] = "/tmp/settings";
constexpr char kPath[] = "/tmp/settings/test.conf";

int Set(const std::string& key, const std::string& value) {
  return ALIBCFileSetKeyValue(kPath, key.c_str(), value.c_str(), 0);
}

std::string Get(const std::string& key) {
  std::vector<char> buf(1024 * 1024);
  const int length =
      ALIBCFileGetKeyValue(kPath, key.c_str(), buf.data(), static_cast<int>(buf.size()), 0);
  return length < 0 ? "(failed)" : buf.data();
}

// The file's text after one key was set in a file of this text.
std::string After(const std::string& text, const std::string& key, const std::string& value) {
  WriteFile(kPath, text);
  EXPECT_GT(Set(key, value), 0);
  return ReadFile(kPath);
}

// Everything in the directory, hidden files included.
std::vector<std::string> NamesIn(const char* dir) {
  std::vector<std::string> names;
  DIR* const stream = opendir(dir);
  while (const dirent* const entry = readdir(stream)) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") {
      names.push_back(name);
    }
  }
  closedir(stream);
  return names;
}

pid_t InChild(const std::function<void()>& body) {
  const pid_t child = fork();
  if (child == 0) {
    body();
    _exit(0);
  }
  return child;
}

int StatusOf(pid_t child) {
  int status = -1;
  waitpid(child, &status, 0);
  return status;
}

// One letter over and over: a mixture of two such values has two letters, or a length of neither.
std::string Letters(char letter) {
  return std::string(letter == 'A' ? 50000 : 90000, letter);
}

bool IsOneOfTheLetters(const std::string& value) {
  return value == Letters('A') || value == Letters('B');
}

// A file system of one page, which the file's text fills.
bool MakeFullDisk(const std::string& text) {
  mkdir(kDir, 0700);
  if (mount("small", kDir, "tmpfs", 0, "size=4k,mode=0700") != 0) {
    return false;
  }
  WriteFile(kPath, text);
  return true;
}

}  // namespace

TEST(FileSetKeyValueTest, ReplacesTheValueOnly) {
  EXPECT_EQ(After("# top\na=1\n\n  key = old \nb=\"x\"\n", "key", "new"),
            "# top\na=1\n\n  key = new \nb=\"x\"\n");
}

TEST(FileSetKeyValueTest, AddsAMissingKeyAtTheEnd) {
  EXPECT_EQ(After("a=1\n", "key", "value"), "a=1\nkey=value\n");
  EXPECT_EQ(After("", "key", "value"), "key=value\n");
}

TEST(FileSetKeyValueTest, EndsAnUnfinishedLastLineFirst) {
  EXPECT_EQ(After("a=1", "key", "value"), "a=1\nkey=value\n");
}

TEST(FileSetKeyValueTest, KeepsTheValueOfALastLineThatEndsInACarriageReturn) {
  EXPECT_EQ(After("x=0\r\na=1\r", "b", "2"), "x=0\r\na=1\r\nb=2\r\n");
  EXPECT_EQ(Get("a"), "1");
  EXPECT_EQ(After("a=1\r", "b", "2"), "a=1\r\nb=2\n");
  EXPECT_EQ(Get("a"), "1");
}

TEST(FileSetKeyValueTest, ReplacesAnUnfinishedLastLine) {
  EXPECT_EQ(After("a=1\nkey=old", "key", "new"), "a=1\nkey=new");
}

TEST(FileSetKeyValueTest, KeepsLineEndsWithCarriageReturns) {
  EXPECT_EQ(After("a=1\r\nkey=old\r\n", "key", "new"), "a=1\r\nkey=new\r\n");
  EXPECT_EQ(After("a=1\r\n", "key", "new"), "a=1\r\nkey=new\r\n");
  EXPECT_EQ(After("a=1\r\nb=2", "key", "new"), "a=1\r\nb=2\r\nkey=new\r\n");
}

TEST(FileSetKeyValueTest, ChangesTheLineThatCounts) {
  EXPECT_EQ(After("key=1\nkey=2\n", "key", "new"), "key=1\nkey=new\n");
}

TEST(FileSetKeyValueTest, KeepsLinesWithNulsAndOddBytes) {
  const std::string odd("\0\xFF=\0\n\x01\n", 7);
  EXPECT_EQ(After(odd + "key=1\n", "key", "2"), odd + "key=2\n");
}

TEST(FileSetKeyValueTest, WritesRawWhatReadsBackTheSame) {
  EXPECT_EQ(After("", "key", "[{\"name\":\"A\"}]"), "key=[{\"name\":\"A\"}]\n");
  EXPECT_EQ(After("", "key", "a\\b=c#d"), "key=a\\b=c#d\n");
  EXPECT_EQ(After("", "key", ""), "key=\n");
}

TEST(FileSetKeyValueTest, WritesTheResetValueAsTwoQuotes) {
  EXPECT_EQ(After("key=5\n", "key", "\"\""), "key=\"\"\n");
  EXPECT_EQ(Get("key"), "\"\"");
}

TEST(FileSetKeyValueTest, QuotesWhatWouldReadBackOtherwise) {
  EXPECT_EQ(After("", "key", " a"), "key=\" a\"\n");
  EXPECT_EQ(After("", "key", "a\t"), "key=\"a\\t\"\n");
  EXPECT_EQ(After("", "key", "a\nb"), "key=\"a\\nb\"\n");
  EXPECT_EQ(After("", "key", "a\r"), "key=\"a\\r\"\n");
  EXPECT_EQ(After("", "key", "\"a\\\""), "key=\"\\\"a\\\\\\\"\"\n");
}

TEST(FileSetKeyValueTest, ReadsBackEveryValueThatItWrote) {
  Random random;
  const std::string favourites = "\"\\\n\r\t =#;[]n";
  WriteFile(kPath, "# kept\nbefore=1\n");
  for (int round = 0; round < 3000; ++round) {
    std::string value;
    for (int length = random.Below(12); length > 0; --length) {
      value +=
          random.OneIn(3)
              ? static_cast<char>(random.Below(255) + 1)
              : favourites[static_cast<size_t>(random.Below(static_cast<int>(favourites.size())))];
    }
    const std::string key = "key" + std::to_string(random.Below(3));
    ASSERT_EQ(Set(key, value), 1);
    ASSERT_EQ(Get(key), value);
    platform::OwnedHash hash(8);
    ASSERT_GT(ALIBCFileGetPair(kPath, hash.slot()), 0);
    ASSERT_EQ(Pairs(hash)[key], value);
  }
  EXPECT_EQ(ReadFile(kPath).substr(0, 16), "# kept\nbefore=1\n");
  platform::OwnedHash hash(8);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 4);
}

TEST(FileSetKeyValueTest, TakesAnyKeyThatReadsBack) {
  WriteFile(kPath, "");
  for (const char* key : {"k", "a b", "\"k\"", "a#b", "a[b", "\xC3\xA4", "a\rb", "k\r"}) {
    EXPECT_EQ(Set(key, key), 1) << key;
    EXPECT_EQ(Get(key), key);
  }
}

TEST(FileSetKeyValueTest, RefusesAKeyThatCannotBeReadBack) {
  WriteFile(kPath, "a=1\n");
  for (const char* key : {"", " k", "k\t", "a=b", "a\nb", "#k", ";k", "[k"}) {
    EXPECT_EQ(Set(key, "v"), -1) << key;
    EXPECT_EQ(ALIBCErrGet(), 0x0100);
  }
  EXPECT_EQ(ReadFile(kPath), "a=1\n");
}

TEST(FileSetKeyValueTest, RefusesNullArguments) {
  WriteFile(kPath, "a=1\n");
  EXPECT_EQ(ALIBCFileSetKeyValue(nullptr, "k", "v", 0), -1);
  EXPECT_EQ(ALIBCFileSetKeyValue(kPath, nullptr, "v", 0), -1);
  EXPECT_EQ(ALIBCFileSetKeyValue(kPath, "k", nullptr, 0), -1);
  EXPECT_EQ(ReadFile(kPath), "a=1\n");
}

TEST(FileSetKeyValueTest, FailsForAMissingFileAndCreatesNothing) {
  mkdir(kDir, 0700);
  EXPECT_EQ(Set("key", "value"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0300);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_THAT(NamesIn(kDir), IsEmpty());
}

TEST(FileSetKeyValueTest, FailsForADirectoryAndLeavesIt) {
  mkdir(kDir, 0700);
  mkdir(kPath, 0700);
  EXPECT_EQ(Set("key", "value"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0401);
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, KeepsModeAndOwner) {
  WriteFile(kPath, "key=old\n");
  ASSERT_EQ(chown(kPath, 50001, 100), 0);
  ASSERT_EQ(chmod(kPath, 04640), 0);
  umask(077);
  EXPECT_EQ(Set("key", "new"), 1);
  struct stat status;
  ASSERT_EQ(stat(kPath, &status), 0);
  EXPECT_EQ(status.st_uid, 50001U);
  EXPECT_EQ(status.st_gid, 100U);
  EXPECT_EQ(status.st_mode & 07777, 04640U);
}

TEST(FileSetKeyValueTest, LeavesOnlyTheFileBehind) {
  WriteFile(kPath, "key=old\n");
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, LeavesNoDescriptorOpen) {
  WriteFile(kPath, "key=old\n");
  const size_t before = NamesIn("/proc/self/fd").size();
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_EQ(Set("=", "bad"), -1);
  EXPECT_EQ(Get("key"), "new");
  EXPECT_EQ(NamesIn("/proc/self/fd").size(), before);
}

TEST(FileSetKeyValueTest, DoesNotWriteWhatIsThereAlready) {
  WriteFile(kPath, "key=same\n");
  struct stat before;
  struct stat after;
  stat(kPath, &before);
  EXPECT_EQ(Set("key", "same"), 1);
  stat(kPath, &after);
  EXPECT_EQ(after.st_ino, before.st_ino);
  EXPECT_EQ(Set("key", "other"), 1);
  stat(kPath, &after);
  EXPECT_NE(after.st_ino, before.st_ino);
}

TEST(FileSetKeyValueTest, FollowsALinkAndKeepsIt) {
  WriteFile("/tmp/real/target.conf", "key=old\n");
  mkdir(kDir, 0700);
  ASSERT_EQ(symlink("../real/target.conf", kPath), 0);
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_EQ(ReadFile("/tmp/real/target.conf"), "key=new\n");
  struct stat status;
  ASSERT_EQ(lstat(kPath, &status), 0);
  EXPECT_TRUE(S_ISLNK(status.st_mode));
}

TEST(FileSetKeyValueTest, TakesARelativePath) {
  WriteFile(kPath, "key=old\n");
  ASSERT_EQ(chdir(kDir), 0);
  EXPECT_EQ(ALIBCFileSetKeyValue("test.conf", "key", "new", 0), 1);
  EXPECT_EQ(Get("key"), "new");
}

TEST(FileSetKeyValueTest, TakesTheLongestName) {
  const std::string path = "/tmp/" + std::string(255, 'n');
  WriteFile(path, "key=old\n");
  EXPECT_EQ(ALIBCFileSetKeyValue(path.c_str(), "key", "new", 0), 1);
  EXPECT_EQ(ReadFile(path), "key=new\n");
}

TEST(FileSetKeyValueTest, TakesOverWhatAKilledProcessLeft) {
  WriteFile(kPath, "key=old\n");
  WriteFile("/tmp/settings/.test.conf.lock", "");
  WriteFile("/tmp/settings/.test.conf.new", "half of a fi");
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_EQ(ReadFile(kPath), "key=new\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, DoesNotWriteThroughALinkThatLiesInItsWay) {
  WriteFile(kPath, "key=old\n");
  WriteFile("/tmp/victim", "victim");
  ASSERT_EQ(symlink("/tmp/victim", "/tmp/settings/.test.conf.new"), 0);
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_EQ(ReadFile("/tmp/victim"), "victim");
  ASSERT_EQ(symlink("/tmp/victim", "/tmp/settings/.test.conf.lock"), 0);
  EXPECT_EQ(Set("key", "newer"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
}

TEST(FileSetKeyValueTest, LeavesTheFileAloneAfterAReadError) {
  WriteFile(kPath, "key=old\n");
  // Reading a process's memory from address 0 fails.
  ASSERT_EQ(mount("/proc/self/mem", kPath, nullptr, MS_BIND, nullptr), 0);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0400);
  EXPECT_EQ(errno, EIO);
  ASSERT_EQ(umount(kPath), 0);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, LeavesTheOldFileOnAFullDisk) {
  const std::string old = "key=old\n#" + std::string(3000, '.') + "\n";
  ASSERT_TRUE(MakeFullDisk(old));
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_EQ(ReadFile(kPath), old);
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, LeavesTheOldFileInAReadOnlyDirectory) {
  mkdir(kDir, 0700);
  ASSERT_EQ(mount("small", kDir, "tmpfs", 0, nullptr), 0);
  WriteFile(kPath, "key=old\n");
  ASSERT_EQ(mount(nullptr, kDir, nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
  EXPECT_EQ(errno, EROFS);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
}

TEST(FileSetKeyValueTest, LeavesTheOldFileWhenTheNewOneCannotBeSynchronised) {
  WriteFile(kPath, "key=old\n");
  On("fsync").InPlatform().Nth(1).Return(-1, EIO);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, TellsThatTheFolderCouldNotBeSynchronised) {
  WriteFile(kPath, "key=old\n");
  On("fsync").InPlatform().Nth(2).Return(-1, EIO);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0601);
  EXPECT_EQ(ReadFile(kPath), "key=new\n");
  // What is not written again is synchronised all the same.
  On("fsync").InPlatform().Nth(1).Return(-1, EIO);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0601);
}

TEST(FileSetKeyValueTest, TakesAFileSystemThatCannotSynchroniseFolders) {
  WriteFile(kPath, "key=old\n");
  On("fsync").InPlatform().Nth(2).Return(-1, EINVAL);
  EXPECT_EQ(Set("key", "new"), 1);
}

TEST(FileSetKeyValueTest, LeavesTheOldFileWhenTheNewOneCannotTakeItsPlace) {
  WriteFile(kPath, "key=old\n");
  // What is mounted cannot be replaced.
  ASSERT_EQ(mount(kPath, kPath, nullptr, MS_BIND, nullptr), 0);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(errno, EBUSY);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, FailsWithoutALock) {
  WriteFile(kPath, "key=old\n");
  On("flock").InPlatform().Nth(1).Return(-1, ENOLCK);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
  EXPECT_EQ(errno, ENOLCK);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
}

TEST(FileSetKeyValueTest, FailsAfterTenSecondsWhenSomebodyHoldsTheLock) {
  WriteFile(kPath, "key=old\n");
  const int lock = open("/tmp/settings/.test.conf.lock", O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  ASSERT_EQ(flock(lock, LOCK_EX), 0);
  On("nanosleep").InPlatform().Return(0);  // which would wait
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
  EXPECT_EQ(errno, EWOULDBLOCK);
  EXPECT_EQ(CallsInPlatform("nanosleep") * kPollMilliseconds, 10000);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
}

TEST(FileSetKeyValueTest, FailsWhenTheLockIsExchangedAgainAndAgain) {
  WriteFile(kPath, "key=old\n");
  On("nanosleep").InPlatform().Return(0);
  On("flock").InPlatform().Before([] {
    WriteFile("/tmp/settings/other", "");
    rename("/tmp/settings/other", "/tmp/settings/.test.conf.lock");
  });
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0500);
}

TEST(FileSetKeyValueTest, FailsWhenWhatAKilledProcessLeftCannotBeRemoved) {
  WriteFile(kPath, "key=old\n");
  mkdir("/tmp/settings/.test.conf.new", 0700);
  EXPECT_EQ(Set("key", "new"), -1);
  EXPECT_EQ(ALIBCErrGet(), 0x0600);
  EXPECT_EQ(ReadFile(kPath), "key=old\n");
}

TEST(FileSetKeyValueTest, LosesNoUpdateOfManyProcesses) {
  WriteFile(kPath, "# kept\n");
  std::vector<pid_t> writers;
  for (int writer = 0; writer < 6; ++writer) {
    writers.push_back(InChild([writer] {
      for (int i = 0; i < 40; ++i) {
        const std::string key = "key_" + std::to_string(writer) + "_" + std::to_string(i);
        if (Set(key, key) != 1) {
          _exit(1);
        }
      }
    }));
  }
  for (const pid_t writer : writers) {
    EXPECT_EQ(StatusOf(writer), 0);
  }
  platform::OwnedHash hash(256);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 240);
  for (const auto& pair : Pairs(hash)) {
    EXPECT_EQ(pair.first, pair.second);
  }
  EXPECT_EQ(ReadFile(kPath).substr(0, 7), "# kept\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, LosesNoUpdateOfManyThreads) {
  WriteFile(kPath, "");
  std::vector<std::thread> writers;
  for (int writer = 0; writer < 4; ++writer) {
    writers.emplace_back([writer] {
      for (int i = 0; i < 40; ++i) {
        EXPECT_EQ(Set(std::to_string(writer * 100 + i), "v"), 1);
      }
    });
  }
  for (std::thread& writer : writers) {
    writer.join();
  }
  platform::OwnedHash hash(256);
  EXPECT_EQ(ALIBCFileGetPair(kPath, hash.slot()), 160);
}

TEST(FileSetKeyValueTest, ShowsReadersTheOldOrTheNewFileOnly) {
  WriteFile(kPath, "text=" + Letters('A') + "\n");
  const pid_t writer = InChild([] {
    for (int i = 0; i < 300; ++i) {
      Set("text", Letters(i % 2 == 0 ? 'B' : 'A'));
    }
  });
  int reads = 0;
  while (waitpid(writer, nullptr, WNOHANG) == 0) {
    ASSERT_TRUE(IsOneOfTheLetters(Get("text")));
    ++reads;
  }
  EXPECT_GT(reads, 10);
}

TEST(FileSetKeyValueTest, LeavesTheOldOrTheNewFileWhenKilled) {
  WriteFile(kPath, "kept=1\ntext=" + Letters('A') + "\n");
  Random random;
  for (int round = 0; round < 150; ++round) {
    const pid_t writer = InChild([] {
      for (int i = 0;; ++i) {
        Set("text", Letters(i % 2 == 0 ? 'B' : 'A'));
      }
    });
    std::this_thread::sleep_for(std::chrono::microseconds(random.Below(3000)));
    kill(writer, SIGKILL);
    ASSERT_TRUE(WIFSIGNALED(StatusOf(writer)));
    ASSERT_TRUE(IsOneOfTheLetters(Get("text")));
    ASSERT_EQ(Get("kept"), "1");
  }
  // Nothing that the killed ones left is in the way, and nothing of it stays.
  EXPECT_EQ(Set("text", "end"), 1);
  EXPECT_EQ(ReadFile(kPath), "kept=1\ntext=end\n");
  EXPECT_THAT(NamesIn(kDir), ElementsAre("test.conf"));
}

TEST(FileSetKeyValueTest, WaitsForAnotherWriter) {
  WriteFile(kPath, "key=old\n");
  const int lock = open("/tmp/settings/.test.conf.lock", O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  ASSERT_EQ(flock(lock, LOCK_EX), 0);
  const pid_t writer = InChild([lock] {
    close(lock);
    Set("key", "new");
  });
  std::this_thread::sleep_for(std::chrono::milliseconds(200));
  EXPECT_EQ(waitpid(writer, nullptr, WNOHANG), 0);
  EXPECT_EQ(Get("key"), "old");
  flock(lock, LOCK_UN);
  EXPECT_EQ(StatusOf(writer), 0);
  EXPECT_EQ(Get("key"), "new");
}

TEST(FileSetKeyValueTest, ReleasesALockThatAChildHasInherited) {
  WriteFile(kPath, "key=old\n");
  int lock = -1;
  pid_t child = -1;
  On("fsync").InPlatform().Nth(1).Before([&] {
    lock = open("/tmp/settings/.test.conf.lock", O_RDWR | O_CLOEXEC);
    child = InChild([] { pause(); });
  });
  EXPECT_EQ(Set("key", "new"), 1);
  EXPECT_EQ(flock(lock, LOCK_EX | LOCK_NB), 0);
  kill(child, SIGKILL);
  StatusOf(child);
}

TEST(FileSetKeyValueTest, IsNotDisturbedBySignals) {
  WriteFile(kPath, "key=old\n");
  struct sigaction action = {};
  action.sa_handler = [](int) {};  // without SA_RESTART: waiting calls end with EINTR
  sigaction(SIGUSR1, &action, nullptr);
  const int lock = open("/tmp/settings/.test.conf.lock", O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  ASSERT_EQ(flock(lock, LOCK_EX), 0);
  const pid_t writer = InChild([lock] {
    close(lock);
    _exit(Set("key", "new") == 1 ? 0 : 1);
  });
  for (int i = 0; i < 20; ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
    kill(writer, SIGUSR1);
  }
  flock(lock, LOCK_UN);
  EXPECT_EQ(StatusOf(writer), 0);
  EXPECT_EQ(Get("key"), "new");
}
