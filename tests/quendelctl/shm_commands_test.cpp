// shm alloc, send and receive: real processes that exchange a block.
#include <gmock/gmock.h>
#include <sys/ipc.h>
#include <sys/shm.h>

#include "quendelctl/run_quendelctl.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

constexpr char kNoSegment[] = "There is no such segment of that size.\n";
constexpr char kNotFound[] = "Failed to locate the segment, errno: No such file or directory\n";

// Returns the segment's size, or -1 when there is none.
long SegmentSize(int key) {
  shmid_ds status = {};
  const int id = shmget(key, 0, 0);
  return id >= 0 && shmctl(id, IPC_STAT, &status) == 0 ? static_cast<long>(status.shm_segsz) : -1;
}

// Sends a file's bytes through the segment 0x51 and returns what became of the receiver.
Output Exchange(const std::string& block, const std::string& receive) {
  WriteFile("/tmp/block", block);
  return Shell(
      "$quendelctl shm alloc 0x51 64 >/dev/null && "
      "{ $quendelctl shm send 0x51 /tmp/block >/tmp/sent; echo $? >>/tmp/sent; } & " +
      std::string("while ! ipcs -m | grep -q 0x00000051; do sleep 0.01; done; ") + receive +
      "; status=$?; wait; exit $status");
}

}  // namespace

TEST(ShmAllocCommandTest, MakesASegment) {
  const Output text = Quendelctl({"shm", "alloc", "0x51", "64"});
  EXPECT_EQ(text.status, 0);
  EXPECT_EQ(text.out, "The segment is there.\n");
  EXPECT_THAT(text.err, IsEmpty());
  EXPECT_EQ(SegmentSize(0x51), 64);
  const Output again = Quendelctl({"shm", "alloc", "81", "64", "--json"});
  EXPECT_EQ(again.status, 0);
  EXPECT_EQ(again.out, "{\"key\":81,\"size\":64,\"success\":true}\n");
}

TEST(ShmAllocCommandTest, TakesEveryKeyButZero) {
  struct Row {
    const char* text;
    int key;
  };
  for (const Row& row : {Row{"-1", -1},
                         {"0xfffffffe", -2},
                         {"2147483647", 2147483647},
                         {"-2147483648", -2147483647 - 1},
                         {"0xAb", 0xAB},
                         {"010", 10}}) {
    EXPECT_EQ(Quendelctl({"shm", "alloc", row.text, "8"}).status, 0) << row.text;
    EXPECT_EQ(SegmentSize(row.key), 8) << row.text;
  }
}

TEST(ShmAllocCommandTest, FailsForASegmentOfAnotherSize) {
  ASSERT_EQ(Quendelctl({"shm", "alloc", "0x51", "8"}).status, 0);
  const Output text = Quendelctl({"shm", "alloc", "0x51", "9"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, "The segment could not be made.\n");
  EXPECT_THAT(text.err, HasSubstr("Failed to create the segment, errno: Invalid argument\n"));
  const Output held = Quendelctl({"shm", "alloc", "0x51", "9", "--hold", "--json"});
  EXPECT_EQ(held.status, 1);
  EXPECT_EQ(
      held.out,
      "{\"error\":\"The segment could not be made.\",\"key\":81,\"reason\":\"failed\",\"size\":9,"
      "\"success\":false}\n");
}

TEST(ShmAllocCommandTest, HoldsTheSegmentUntilASignal) {
  // The reader sees the end of the output before the program ends.
  const Output output = Shell(
      "mkfifo /tmp/pipe; { exec $quendelctl shm alloc 0x51 64 --hold >/tmp/pipe; } & "
      "timeout 20 cat /tmp/pipe; echo $?; ipcs -m | awk '$1 == \"0x00000051\" { print $6 }'; "
      "kill $!; wait $!; echo $?; ipcs -m | awk '$1 == \"0x00000051\" { print $6 }'");
  EXPECT_EQ(output.out, "The segment is there.\n0\n1\n143\n0\n");
}

TEST(ShmReceiveCommandTest, PrintsTheBytesAsTheyAre) {
  const Output output = Exchange("a\x1b[2J\xff\n", "$quendelctl shm receive 0x51 9");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, std::string("a\x1b[2J\xff\n\0\0", 9));
  EXPECT_THAT(output.err, IsEmpty());
  EXPECT_EQ(ReadFile("/tmp/sent"), "The block was received.\n0\n");
  EXPECT_EQ(SegmentSize(0x51), -1);
}

TEST(ShmReceiveCommandTest, PrintsTheBytesInJson) {
  const Output output = Exchange("a\xff", "$quendelctl shm receive 0x51 3 --json");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out,
            "{\"block_hex\":\"61ff00\",\"key\":81,\"result\":0,\"size\":3,\"success\":true}\n");
}

TEST(ShmReceiveCommandTest, ReplacesWhatAFileHeld) {
  WriteFile("/tmp/received", "something longer");
  const Output output = Exchange("hello", "$quendelctl shm receive 0x51 5 /tmp/received");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "The block was received.\n");
  EXPECT_EQ(ReadFile("/tmp/received"), "hello");
}

TEST(ShmReceiveCommandTest, KeepsTheBlockInTheFileOnly) {
  const Output output = Exchange("hello", "$quendelctl shm receive 0x51 5 /tmp/received --json");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "{\"key\":81,\"result\":0,\"size\":5,\"success\":true}\n");
  EXPECT_EQ(ReadFile("/tmp/received"), "hello");
}

TEST(ShmReceiveCommandTest, DoesNotLetABlockActOnATerminal) {
  const Output output =
      Exchange("a\tb\n\x1b[2J", "script -qec \"$quendelctl shm receive 0x51 8\" /dev/null");
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.out, "a\tb\r\n\\x1b[2J");
}

TEST(ShmReceiveCommandTest, FailsWhenTheFileCannotBeWritten) {
  const Output output = Exchange("hello", "$quendelctl shm receive 0x51 5 /dev/full");
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.err, "quendelctl: cannot write /dev/full: No space left on device\n");
}

TEST(ShmReceiveCommandTest, LeavesTheBlockWhenTheFileCannotBeOpened) {
  ASSERT_EQ(Quendelctl({"shm", "alloc", "0x51", "64"}).status, 0);
  const Output output = Quendelctl({"shm", "receive", "0x51", "5", "/tmp/missing/file"});
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.err, "quendelctl: cannot write /tmp/missing/file: No such file or directory\n");
  EXPECT_EQ(SegmentSize(0x51), 64);
}

TEST(ShmReceiveCommandTest, FailsWithoutASegment) {
  WriteFile("/tmp/received", "old");
  const Output text = Quendelctl({"shm", "receive", "0x51", "5", "/tmp/received"});
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, kNoSegment);
  EXPECT_THAT(text.err, HasSubstr(kNotFound));
  EXPECT_EQ(ReadFile("/tmp/received"), "old");
  const Output json = Quendelctl({"shm", "receive", "0x51", "5", "--json"});
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(
      json.out,
      "{\"error\":\"There is no such segment of that size.\",\"key\":81,\"reason\":\"failed\","
      "\"result\":-2,\"size\":5,\"success\":false}\n");
}

TEST(ShmSendCommandTest, SendsTheStandardInput) {
  const Output output = Shell(
      "$quendelctl shm alloc 0x51 5 >/dev/null; "
      "printf hello | $quendelctl shm send 0x51 --json >/tmp/sent & "
      "$quendelctl shm receive 0x51 5; wait");
  EXPECT_EQ(output.out, "hello");
  EXPECT_EQ(ReadFile("/tmp/sent"), "{\"key\":81,\"result\":0,\"size\":5,\"success\":true}\n");
}

TEST(ShmSendCommandTest, FailsWithoutASegment) {
  const Output text = Quendelctl({"shm", "send", "0x51", "-"}, "hello");
  EXPECT_EQ(text.status, 1);
  EXPECT_EQ(text.out, kNoSegment);
  EXPECT_THAT(text.err, HasSubstr(kNotFound));
  const Output json = Quendelctl({"shm", "send", "0x51", "--json"}, "hello");
  EXPECT_EQ(json.status, 1);
  EXPECT_EQ(
      json.out,
      "{\"error\":\"There is no such segment of that size.\",\"key\":81,\"reason\":\"failed\","
      "\"result\":-2,\"size\":5,\"success\":false}\n");
}

TEST(ShmSendCommandTest, FailsWhenTheBlockIsLargerThanTheSegment) {
  ASSERT_EQ(Quendelctl({"shm", "alloc", "0x51", "4"}).status, 0);
  const Output output = Quendelctl({"shm", "send", "0x51"}, "hello");
  EXPECT_EQ(output.status, 1);
  EXPECT_EQ(output.out, kNoSegment);
}

// Both wait their time out here, at once.
TEST(ShmCommandTest, FailsWhenTheOtherSideDoesNotCome) {
  const Output output = Shell(
      "$quendelctl shm alloc 1 5 >/dev/null; $quendelctl shm alloc 2 5 >/dev/null; "
      "{ $quendelctl shm receive 2 5 >/tmp/received 2>/tmp/reasons; echo $? >>/tmp/received; } & "
      "printf hello | $quendelctl shm send 1; echo $?; wait");
  EXPECT_EQ(output.out, "The block was not received.\n1\n");
  EXPECT_THAT(output.err, HasSubstr("Receiver has not received data in memory\n"));
  EXPECT_EQ(ReadFile("/tmp/received"), "No block was received.\n1\n");
  EXPECT_THAT(ReadFile("/tmp/reasons"), HasSubstr("Sender has not put data in memory\n"));
}

TEST(ShmCommandTest, RejectsAWrongCommandLine) {
  ASSERT_EQ(Quendelctl({"shm", "alloc", "0x51", "64"}).status, 0);
  WriteFile("/tmp/empty", "");
  WriteFile("/tmp/zero", std::string("\0x", 2));
  WriteFile("/tmp/star", "*x");
  struct Row {
    std::vector<std::string> arguments;
    const char* complaint;
  };
  const Row rows[] = {
      {{}, "shm: one of these commands is required: alloc, send, receive"},
      {{"free"}, "not expected: free"},
      {{"alloc"}, "KEY is required"},
      {{"alloc", "1"}, "SIZE is required"},
      {{"alloc", "x", "5"}, "KEY: x is not a whole number that fits 32 bits"},
      {{"alloc", "2147483648", "5"}, "KEY: 2147483648 is not"},
      {{"alloc", "0x", "5"}, "KEY: 0x is not a number that fits 32 bits"},
      {{"alloc", "0x1g", "5"}, "KEY: 0x1g is not"},
      {{"alloc", "0x100000000", "5"}, "KEY: 0x100000000 is not"},
      {{"alloc", "0", "5"}, "KEY: 0 is no key"},
      {{"alloc", "0x0", "5"}, "KEY: 0 is no key"},
      {{"alloc", "1", "0"}, "SIZE: 0 is not a size"},
      {{"alloc", "1", "-5"}, "SIZE: -5 is not a size"},
      {{"alloc", "1", "5k"}, "SIZE: 5k is not a whole number that fits 32 bits"},
      {{"send"}, "KEY is required"},
      {{"send", "0", "/tmp/star"}, "KEY: 0 is no key"},
      {{"send", "0x51", "/tmp/missing"}, "FILE: cannot read /tmp/missing: No such file"},
      {{"send", "0x51", "/tmp/empty"}, "FILE: must have at least 1"},
      {{"send", "0x51", "/tmp/zero"}, "FILE: must begin neither with a zero byte nor with *"},
      {{"send", "0x51", "/tmp/star"}, "FILE: must begin neither with a zero byte nor with *"},
      {{"receive", "0x51"}, "SIZE is required"},
      {{"receive", "0", "5"}, "KEY: 0 is no key"},
      {{"receive", "0x51", "0"}, "SIZE: 0 is not a size"},
  };
  for (const Row& row : rows) {
    std::vector<std::string> arguments = {"shm"};
    arguments.insert(arguments.end(), row.arguments.begin(), row.arguments.end());
    const Output output = Quendelctl(arguments);
    EXPECT_EQ(output.status, 2) << row.complaint;
    EXPECT_THAT(output.out, IsEmpty());
    EXPECT_THAT(output.err, HasSubstr(row.complaint));
  }
  EXPECT_EQ(SegmentSize(1), -1);
  EXPECT_EQ(SegmentSize(0x51), 64);
}
