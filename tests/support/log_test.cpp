// The captured log.
#include "support/log.h"

#include <gmock/gmock.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <thread>

#include "base/log.h"
#include "support/appliance.h"

using namespace quendel::test;
using testing::AllOf;
using testing::ElementsAre;
using testing::Field;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;
using testing::UnorderedElementsAre;

namespace {

constexpr char kLogUnit[] = "some_unit";

void LogThroughList(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  vsyslog(priority, format, arguments);
  va_end(arguments);
}

// Runs `action` in a child that ends as the library's children do.
template <typename Action>
void InChild(Action action) {
  const pid_t child = fork();
  if (child == 0) {
    action();
    _exit(0);
  }
  waitpid(child, nullptr, 0);
}

}  // namespace

TEST(LogTest, IsEmptyAtTheStart) {
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(LogTest, HoldsEachLineInItsParts) {
  const int line = __LINE__ + 1;
  QUENDEL_LOG("Failed to get '%s', ret = %d", "it", -3);
  ASSERT_THAT(Log(), SizeIs(1));
  EXPECT_EQ(Log()[0].unit, "some_unit");
  EXPECT_EQ(Log()[0].line, line);
  EXPECT_EQ(Log()[0].message, "Failed to get 'it', ret = -3");
  EXPECT_EQ(Log()[0].priority, LOG_ERR);
}

TEST(LogTest, KeepsTheOrder) {
  QUENDEL_LOG("one");
  QUENDEL_LOG("two");
  EXPECT_THAT(Log(), ElementsAre(Logged("some_unit", "one"), Logged("some_unit", "two")));
}

TEST(LogTest, ForgetsWhatIsCleared) {
  QUENDEL_LOG("one");
  ClearLog();
  EXPECT_THAT(Log(), IsEmpty());
  QUENDEL_LOG("two");
  EXPECT_THAT(Log(), ElementsAre(Logged("some_unit", "two")));
}

TEST(LogTest, ExpandsTheSystemsErrorText) {
  errno = ENOSPC;
  QUENDEL_LOG("Failed, errno: %m");
  EXPECT_THAT(Log(), ElementsAre(Logged("some_unit", "Failed, errno: No space left on device")));
}

TEST(LogTest, LeavesErrnoAlone) {
  errno = ENOSPC;
  QUENDEL_LOG("Failed %s", std::string(100000, 'x').c_str());
  EXPECT_EQ(errno, ENOSPC);
}

TEST(LogTest, HoldsMessagesOfAnyLengthAndBytes) {
  const std::string message = std::string(3'000'000, 'x') + "\n:12 \xff%s";
  syslog(LOG_ERR, "%s:%d %s", kLogUnit, __LINE__, message.c_str());
  syslog(LOG_ERR, "%s:%d %s", kLogUnit, __LINE__, "");
  EXPECT_THAT(Log(), ElementsAre(Logged("some_unit", message), Logged("some_unit", "")));
}

TEST(LogTest, SeesTheLinesOfForkedChildren) {
  QUENDEL_LOG("before");
  InChild([] {
    QUENDEL_LOG("in the child");
    InChild([] { QUENDEL_LOG("in its child"); });
  });
  QUENDEL_LOG("after");
  EXPECT_THAT(Log(),
              ElementsAre(Logged("some_unit", "before"), Logged("some_unit", "in the child"),
                          Logged("some_unit", "in its child"), Logged("some_unit", "after")));
}

TEST(LogTest, SeesChildrenThatClosedEveryDescriptor) {
  InChild([] {
    for (int fd = 0; fd < 1024; ++fd) {
      close(fd);
    }
    QUENDEL_LOG("in the child");
  });
  EXPECT_THAT(Log(), SizeIs(1));
}

TEST(LogTest, LosesNothingOfManyWritersAtOnce) {
  constexpr int kLines = 2000;
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([] {
      for (int line = 0; line < kLines; ++line) {
        QUENDEL_LOG("a message of some length");
      }
    });
  }
  for (std::thread& thread : threads) {
    thread.join();
  }
  EXPECT_THAT(Log(), AllOf(SizeIs(4 * kLines),
                           testing::Each(Logged("some_unit", "a message of some length"))));
}

TEST(LogTest, TakesVariableArgumentLists) {
  LogThroughList(LOG_ERR, "some_unit:7 %d", 1);
  EXPECT_THAT(Log(), ElementsAre(Logged("some_unit", "1")));
}

TEST(LogTest, TakesALineOfAnotherFormForAMessage) {
  for (const char* text : {"no unit", "unit:", "unit: x", "unit:12", "unit:12x y", ""}) {
    ClearLog();
    syslog(LOG_ERR, "%s", text);
    EXPECT_THAT(Log(), ElementsAre(Logged("", text)));
    EXPECT_EQ(Log()[0].line, 0);
  }
}

TEST(LogTest, SendsNothingToTheSystem) {
  QUENDEL_LOG("one");
  std::this_thread::sleep_for(std::chrono::milliseconds(20));
  EXPECT_EQ(ReadFile("/run/syslog.txt"), "");
}

TEST(LoggedTest, ComparesUnitMessageAndPriority) {
  QUENDEL_LOG("one");
  syslog(LOG_INFO | LOG_DAEMON, "some_unit:1 two");
  const std::vector<LogLine> lines = Log();
  EXPECT_THAT(lines[0], Logged("some_unit", "one"));
  EXPECT_THAT(lines[0], Logged("some_unit", StartsWith("o")));
  EXPECT_THAT(lines[0], Not(Logged("some_unit", "on")));
  EXPECT_THAT(lines[0], Not(Logged("other_unit", "one")));
  EXPECT_THAT(lines[1], Not(Logged("some_unit", "two")));
  EXPECT_THAT(lines[1], Field(&LogLine::priority, LOG_INFO | LOG_DAEMON));
}
