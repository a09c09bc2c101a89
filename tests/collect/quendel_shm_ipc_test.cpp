// The shared-memory channel, between processes of their own. Nobody waits for real seconds: each
// sleep of one side is where the other side takes its step.
#include <gmock/gmock.h>
#include <sys/ipc.h>
#include <sys/shm.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <functional>

#include "quendel.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "quendel_shm_ipc";
constexpr int kKey = 0x51;
constexpr size_t kSize = 10000;

// A block of every byte there is, beginning with a given one.
std::string Block(char first) {
  std::string block(kSize, '\0');
  for (size_t i = 0; i < kSize; ++i) {
    block[i] = static_cast<char>(i * 7 + i / 256);
  }
  block[0] = first;
  return block;
}

int Send(std::string block) {
  return QUENDELShmSend(block.data(), block.size(), kKey);
}

int Receive(std::string& block) {
  return QUENDELShmReceive(block.data(), block.size(), kKey);
}

// A word that one process waits for and the other gives.
class Signal {
 public:
  Signal() { EXPECT_EQ(pipe(ends_), 0); }
  void Give() { EXPECT_EQ(write(ends_[1], "!", 1), 1); }
  void Await() {
    char word = 0;
    EXPECT_EQ(read(ends_[0], &word, 1), 1);
  }

 private:
  int ends_[2] = {};
};

// The other process. What it returns is what Result() gives, 99 when an expectation failed there.
class Process {
 public:
  explicit Process(const std::function<int()>& body) : id_(fork()) {
    if (id_ == 0) {
      const int result = body();
      _exit(testing::Test::HasFailure() ? 99 : result & 0x7F);
    }
  }
  int Result() const {
    int status = 0;
    EXPECT_EQ(waitpid(id_, &status, 0), id_);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

 private:
  pid_t id_;
};

shmid_ds Segment() {
  shmid_ds segment = {};
  EXPECT_EQ(shmctl(shmget(kKey, 0, 0), IPC_STAT, &segment), 0);
  return segment;
}

bool SegmentExists() {
  return shmget(kKey, 0, 0) != -1;
}

char FirstByte() {
  const void* segment = shmat(shmget(kKey, 0, 0), nullptr, SHM_RDONLY);
  const char first = *static_cast<const char*>(segment);
  shmdt(segment);
  return first;
}

// Runs an action when this process would have slept for so many seconds.
void AtSecond(int second, const std::function<void()>& action) {
  On("sleep").Before([second, action] {
    if (SleptSeconds() == second) {
      action();
    }
  });
}

}  // namespace

// ---- Making the segment.

TEST(ShmAllocTest, MakesASegmentForEverybody) {
  Record("shmget");
  Record("shmat");
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  const std::vector<std::string> recorded = Recorded();
  const std::string id = std::to_string(shmget(kKey, 0, 0));
  EXPECT_THAT(recorded, ElementsAre("81|10000|950", id + "|0"));
  EXPECT_EQ(Segment().shm_perm.mode & 0777U, 0666U);
  EXPECT_EQ(Segment().shm_segsz, kSize);
  EXPECT_EQ(FirstByte(), '\0');
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ShmAllocTest, ReusesASegmentThatIsThere) {
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  const int id = shmget(kKey, 0, 0);
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(shmget(kKey, 0, 0), id);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ShmAllocTest, StaysAttachedUntilTheProcessEnds) {
  Signal made;
  Signal seen;
  const Process creator([&] {
    const int result = QUENDELShmAlloc(kSize, kKey);
    made.Give();
    seen.Await();
    return result;
  });
  made.Await();
  EXPECT_EQ(Segment().shm_nattch, 1U);
  seen.Give();
  EXPECT_EQ(creator.Result(), 0);
  EXPECT_EQ(Segment().shm_nattch, 0U);
}

TEST(ShmAllocTest, FailsWhenTheSegmentCannotBeMade) {
  On("shmget").Nth(1).Return(-1, ENOSPC);
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to create the segment, errno: No space left "
                                        "on device")));
  EXPECT_EQ(Calls("shmat"), 0);
}

TEST(ShmAllocTest, FailsForALargerSegmentThanTheOneThatIsThere) {
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(QUENDELShmAlloc(kSize * 2, kKey), -1);
  EXPECT_THAT(Log(),
              ElementsAre(Logged(kUnit, "Failed to create the segment, errno: Invalid argument")));
}

TEST(ShmAllocTest, FailsWhenTheSegmentCannotBeAttached) {
  On("shmat").Nth(1).Return(-1, EMFILE);
  EXPECT_EQ(QUENDELShmAlloc(kSize, kKey), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to attach the segment to data space, errno: "
                                        "Too many open files")));
}

// ---- Both sides.

TEST(ShmExchangeTest, SenderMayComeFirstByUpTo20Seconds) {
  for (const int seconds : {1, 2, 20}) {
    ResetCalls();
    ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
    Signal sent;
    const Process receiver([&] {
      sent.Await();
      std::string received(kSize, '#');
      const int result = Receive(received);
      EXPECT_EQ(received, Block('a'));
      EXPECT_EQ(SleptSeconds(), 0);  // the block was there
      return result;
    });
    AtSecond(seconds, [&] {
      sent.Give();
      EXPECT_EQ(receiver.Result(), 0);
    });
    EXPECT_EQ(Send(Block('a')), 0);
    EXPECT_EQ(SleptSeconds(), seconds);
    EXPECT_FALSE(SegmentExists());
  }
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ShmExchangeTest, ReceiverMayComeFirstByUpTo20Seconds) {
  for (const int seconds : {1, 2, 20}) {
    ResetCalls();
    ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
    Signal start;
    Signal sent;
    Signal received;
    const Process sender([&] {
      start.Await();
      AtSecond(1, [&] {
        sent.Give();
        received.Await();
      });
      const int result = Send(Block('a'));
      EXPECT_EQ(SleptSeconds(), 1);
      return result;
    });
    AtSecond(seconds, [&] {
      start.Give();
      sent.Await();
    });
    std::string block(kSize, '#');
    EXPECT_EQ(Receive(block), 0);
    EXPECT_EQ(block, Block('a'));
    EXPECT_EQ(SleptSeconds(), seconds);
    received.Give();
    EXPECT_EQ(sender.Result(), 0);
    EXPECT_FALSE(SegmentExists());
  }
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ShmExchangeTest, TheSendersBlockStaysAsItIs) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  Signal sent;
  const Process receiver([&] {
    sent.Await();
    std::string received(kSize, '#');
    return Receive(received);
  });
  AtSecond(1, [&] {
    sent.Give();
    EXPECT_EQ(receiver.Result(), 0);
  });
  std::string block = Block('a');
  EXPECT_EQ(QUENDELShmSend(block.data(), block.size(), kKey), 0);
  EXPECT_EQ(block, Block('a'));
}

TEST(ShmExchangeTest, SecondReceiverFindsNothing) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(Send(Block('*')), 0);
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), 0);
  EXPECT_EQ(Receive(block), -2);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to locate the segment, errno: No such file "
                                        "or directory")));
}

// ---- Sending.

TEST(ShmSendTest, FindsNoSegmentAndDoesNotWait) {
  Record("shmget");
  EXPECT_EQ(Send(Block('a')), -2);
  EXPECT_THAT(Recorded(), ElementsAre("81|10000|438"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to locate the segment, errno: No such file "
                                        "or directory")));
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_EQ(Calls("shmdt"), 0);
}

TEST(ShmSendTest, FailsWhenTheSegmentCannotBeAttached) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ResetCalls();
  On("shmat").Nth(1).Return(-1, EACCES);
  EXPECT_EQ(Send(Block('a')), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to attach the segment to data space, errno: "
                                        "Permission denied")));
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_EQ(Calls("shmdt"), 1);  // even so
  EXPECT_EQ(FirstByte(), '\0');
}

TEST(ShmSendTest, GivesUpAfter20Seconds) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ResetCalls();
  EXPECT_EQ(Send(Block('a')), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Receiver has not received data in memory")));
  EXPECT_EQ(Calls("sleep"), 20);
  EXPECT_EQ(SleptSeconds(), 20);
  EXPECT_EQ(Calls("shmdt"), 1);
  EXPECT_EQ(Calls("shmctl"), 0);  // the receiver removes the segment
  EXPECT_EQ(FirstByte(), 'a');
}

TEST(ShmSendTest, BlockThatBeginsWithAStarCountsAsReceived) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(Send(Block('*')), 0);
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_TRUE(SegmentExists());
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(ShmSendTest, LetsGoOfTheSegment) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(Send(Block('*')), 0);
  EXPECT_EQ(Segment().shm_nattch, 1U);  // the creator
}

// ---- Receiving.

TEST(ShmReceiveTest, FindsNoSegmentAndDoesNotWait) {
  Record("shmget");
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), -2);
  EXPECT_THAT(Recorded(), ElementsAre("81|10000|438"));
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to locate the segment, errno: No such file "
                                        "or directory")));
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_EQ(Calls("shmctl"), 0);
  EXPECT_EQ(block, std::string(kSize, '#'));
}

TEST(ShmReceiveTest, RemovesASegmentThatCannotBeAttached) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ResetCalls();
  On("shmat").Nth(1).Return(-1, EACCES);
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit,
                                        "Failed to attach the segment to data space, errno: "
                                        "Permission denied")));
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_EQ(Calls("shmdt"), 1);
  EXPECT_FALSE(SegmentExists());
  EXPECT_EQ(block, std::string(kSize, '#'));
}

TEST(ShmReceiveTest, GivesUpAfter20SecondsAndRemovesTheSegment) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ResetCalls();
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Sender has not put data in memory")));
  EXPECT_EQ(Calls("sleep"), 20);
  EXPECT_EQ(SleptSeconds(), 20);
  EXPECT_EQ(block, std::string(kSize, '#'));
  EXPECT_EQ(Send(Block('a')), -2);  // whoever comes later finds no segment
}

TEST(ShmReceiveTest, NeverSeesABlockThatBeginsWithAZero) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(Send(Block('\0')), -1);
  ClearLog();
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), -1);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, "Sender has not put data in memory")));
}

TEST(ShmReceiveTest, TakesABlockThatBeginsWithAStar) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  EXPECT_EQ(Send(Block('*')), 0);
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), 0);
  EXPECT_EQ(block, Block('*'));
}

TEST(ShmReceiveTest, TakesABlockOfOneByte) {
  ASSERT_EQ(QUENDELShmAlloc(1, kKey), 0);
  EXPECT_EQ(Send("x"), -1);  // nobody received it in time, but it is there
  std::string block(3, '#');
  EXPECT_EQ(QUENDELShmReceive(block.data(), 1, kKey), 0);
  EXPECT_EQ(block, "x##");
}

TEST(ShmReceiveTest, TriesUntilTheSegmentIsRemoved) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ASSERT_EQ(Send(Block('*')), 0);
  ResetCalls();
  constexpr int kFailures = 50;
  for (int i = 1; i <= kFailures; ++i) {
    On("shmctl").Nth(i).Return(-1, EPERM);
  }
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), 0);
  EXPECT_EQ(Calls("shmctl"), kFailures + 1);
  EXPECT_EQ(SleptSeconds(), 0);
  EXPECT_THAT(Log(), SizeIs(kFailures));
  EXPECT_THAT(Log(), Each(Logged(kUnit,
                                 "Failed to mark the segment to be destroyed, errno: "
                                 "Operation not permitted")));
  EXPECT_FALSE(SegmentExists());
}

TEST(ShmReceiveTest, MarksTheSegmentBeforeItLetsGo) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ASSERT_EQ(Send(Block('*')), 0);
  const std::string id = std::to_string(shmget(kKey, 0, 0));
  ResetCalls();
  Record("shmctl");
  Record("shmdt");
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), 0);
  EXPECT_THAT(Recorded(), ElementsAre(id + "|0", ""));  // an address is not recorded
}

TEST(ShmReceiveTest, LetsGoOfTheSegment) {
  ASSERT_EQ(QUENDELShmAlloc(kSize, kKey), 0);
  ASSERT_EQ(Send(Block('*')), 0);
  const int id = shmget(kKey, 0, 0);
  std::string block(kSize, '#');
  EXPECT_EQ(Receive(block), 0);
  shmid_ds segment = {};
  ASSERT_EQ(shmctl(id, IPC_STAT, &segment), 0);
  EXPECT_EQ(segment.shm_nattch, 1U);  // the creator; the system destroys it when that ends
}
