// The lock that programs take before a collection run, between real processes.
#include "common/collect_lock.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <functional>
#include <string>

#include "support/appliance.h"

using namespace quendel::test;
using quendel::programs::CollectLock;
using Result = quendel::programs::CollectLock::Result;

namespace {

constexpr char kFile[] = "/run/quendel/collect.lock";

// Another process that does something and then stays until it is killed.
class Neighbour {
 public:
  explicit Neighbour(const std::function<void()>& work) {
    int ends[2];
    EXPECT_EQ(pipe(ends), 0);
    process_ = fork();
    if (process_ == 0) {
      work();
      EXPECT_EQ(write(ends[1], "", 1), 1);
      for (;;) {
        pause();
      }
    }
    char done = 0;
    EXPECT_EQ(read(ends[0], &done, 1), 1);
    close(ends[0]);
    close(ends[1]);
  }
  ~Neighbour() { Kill(); }
  void Kill() {
    if (process_ > 0) {
      kill(process_, SIGKILL);
      waitpid(process_, nullptr, 0);
      process_ = 0;
    }
  }
  pid_t id() const { return process_; }

 private:
  pid_t process_ = 0;
};

void TakeForGood(const char* program) {
  ASSERT_EQ((new CollectLock(program))->Take(), Result::kTaken);
}

}  // namespace

TEST(CollectLockTest, IsTakenAndWritesDownByWhom) {
  CollectLock lock("quendelctl");
  EXPECT_EQ(lock.Take(), Result::kTaken);
  EXPECT_EQ(ReadFile(kFile), std::to_string(getpid()) + " quendelctl\n");
}

TEST(CollectLockTest, BelongsToItsUserAlone) {
  umask(0);
  CollectLock lock("quendelctl");
  ASSERT_EQ(lock.Take(), Result::kTaken);
  struct stat status = {};
  ASSERT_EQ(stat(kFile, &status), 0);
  EXPECT_EQ(status.st_mode, S_IFREG | 0600U);
  ASSERT_EQ(stat("/run/quendel", &status), 0);
  EXPECT_EQ(status.st_mode, S_IFDIR | 0755U);
}

TEST(CollectLockTest, TellsWhoHoldsIt) {
  const Neighbour holder([] { TakeForGood("a program"); });
  CollectLock lock("quendelctl");
  ASSERT_EQ(lock.Take(), Result::kHeld);
  EXPECT_EQ(lock.holder().process, holder.id());
  EXPECT_EQ(lock.holder().program, "a program");
}

TEST(CollectLockTest, NamesNobodyWhoseNameIsNotThereYet) {
  const Neighbour holder([] { TakeForGood("quendeld"); });
  for (const std::string text :
       {"", "x", "1", "1 ", "1 cut", "0 nobody\n", "-1 all\n", "99999999 dead\n", "1x\n"}) {
    WriteFile(kFile, text);
    CollectLock lock("quendelctl");
    ASSERT_EQ(lock.Take(), Result::kHeld);
    EXPECT_EQ(lock.holder().process, 0) << text;
    EXPECT_EQ(lock.holder().program, "") << text;
  }
}

TEST(CollectLockTest, IsFreeOnceItsHolderIsKilled) {
  Neighbour holder([] { TakeForGood("a program with a rather long name"); });
  CollectLock lock("quendelctl");
  ASSERT_EQ(lock.Take(), Result::kHeld);
  holder.Kill();
  EXPECT_EQ(lock.Take(), Result::kTaken);
  EXPECT_EQ(ReadFile(kFile), std::to_string(getpid()) + " quendelctl\n");
}

TEST(CollectLockTest, IsHeldAsLongAsAChildOfItsHolderLives) {
  pid_t child = 0;
  {
    CollectLock lock("quendelctl");
    ASSERT_EQ(lock.Take(), Result::kTaken);
    child = fork();
    if (child == 0) {
      for (;;) {
        pause();
      }
    }
  }
  CollectLock next("quendelctl");
  EXPECT_EQ(next.Take(), Result::kHeld);
  kill(child, SIGKILL);
  waitpid(child, nullptr, 0);
  EXPECT_EQ(next.Take(), Result::kTaken);
}

TEST(CollectLockTest, IsNotHeldByAProgramThatItsHolderStarted) {
  {
    CollectLock lock("quendelctl");
    ASSERT_EQ(lock.Take(), Result::kTaken);
    ASSERT_EQ(system("sleep 1000 & echo $! > /tmp/sleeper"), 0);
  }
  EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kTaken);
  kill(std::stoi(ReadFile("/tmp/sleeper")), SIGKILL);
}

TEST(CollectLockTest, WaitsUntilItIsFree) {
  Neighbour holder([] { TakeForGood("quendeld"); });
  const pid_t ends = fork();
  if (ends == 0) {
    usleep(300'000);
    kill(holder.id(), SIGKILL);
    _exit(0);
  }
  CollectLock lock("quendelctl");
  EXPECT_EQ(lock.Wait(), Result::kTaken);
  EXPECT_EQ(waitpid(ends, nullptr, WNOHANG), ends);
}

TEST(CollectLockTest, GivesUpWaitingWhenASignalComes) {
  const Neighbour holder([] { TakeForGood("quendeld"); });
  struct sigaction action = {};
  action.sa_handler = [](int) {};
  ASSERT_EQ(sigaction(SIGALRM, &action, nullptr), 0);
  ualarm(100'000, 100'000);
  CollectLock lock("quendelctl");
  EXPECT_EQ(lock.Wait(), Result::kFailed);
  EXPECT_EQ(errno, EINTR);
  ualarm(0, 0);
}

TEST(CollectLockTest, IsTheOneThatOthersWillFindAfterItsFolderWasMadeAgain) {
  Neighbour holder([] { TakeForGood("quendeld"); });
  const pid_t waiter = fork();
  if (waiter == 0) {
    CollectLock lock("waiter");
    lock.Wait();
    for (;;) {
      pause();
    }
  }
  usleep(200'000);  // now it waits for the old file
  RemoveFile("/run/quendel");
  holder.Kill();
  for (int i = 0; i < 500 && !Exists(kFile); ++i) {
    usleep(10'000);
  }
  for (int i = 0; i < 500 && ReadFile(kFile).empty(); ++i) {
    usleep(10'000);
  }
  CollectLock lock("quendelctl");
  ASSERT_EQ(lock.Take(), Result::kHeld);
  EXPECT_EQ(lock.holder().process, waiter);
  kill(waiter, SIGKILL);
}

TEST(CollectLockTest, FailsWhereOthersCouldReplaceIt) {
  WriteFile("/run/quendel/x", "");
  for (const mode_t mode : {0775U, 0757U}) {
    ASSERT_EQ(chmod("/run/quendel", mode), 0);
    EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kFailed);
    EXPECT_EQ(errno, EPERM);
  }
  ASSERT_EQ(chmod("/run/quendel", 0755), 0);
  ASSERT_EQ(chown("/run/quendel", 1234, 1234), 0);
  EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kFailed);
  EXPECT_EQ(errno, EPERM);
}

TEST(CollectLockTest, FollowsNoLinkAndTakesNothingButAFile) {
  WriteFile("/tmp/elsewhere/x", "");
  ASSERT_EQ(symlink("/tmp/elsewhere", "/run/quendel"), 0);
  EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kFailed);
  EXPECT_FALSE(Exists("/tmp/elsewhere/collect.lock"));
  RemoveFile("/run/quendel");
  WriteFile("/run/quendel/x", "");
  ASSERT_EQ(symlink("/tmp/made", kFile), 0);
  EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kFailed);
  EXPECT_EQ(errno, ELOOP);
  EXPECT_FALSE(Exists("/tmp/made"));
  RemoveFile(kFile);
  ASSERT_EQ(mkfifo(kFile, 0600), 0);
  EXPECT_EQ(CollectLock("quendelctl").Take(), Result::kFailed);
  EXPECT_EQ(errno, EPERM);
}
