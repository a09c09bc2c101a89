// The log line: what it says, and what is left of one that the system's log would drop.
#include <gmock/gmock.h>
#include <pthread.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "base/log.h"
#include "support/appliance.h"
#include "support/log.h"

using namespace quendel::test;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

namespace {

constexpr char kLogUnit[] = "unit";

// What a log takes whose sockets nobody has changed, of a line and of its text.
constexpr size_t kLongest = 212000;

std::string TextOf(size_t size) {
  return std::string(size, 'x');
}

// The only line's message, without the unit and the line number.
std::string Message() {
  const auto lines = Log();
  EXPECT_THAT(lines, SizeIs(1));
  return lines.empty() ? "" : lines.front().message;
}

size_t LineLength() {
  const LogLine line = Log().front();
  return line.unit.size() + 1 + std::to_string(line.line).size() + 1 + line.message.size();
}

void* LogLongText(void* /*unused*/) {
  QUENDEL_LOG("Failed [%s] now", TextOf(400000).c_str());
  return nullptr;
}

}  // namespace

// The system's own, behind what captures the library's lines. The appliance reads its /dev/log.
extern "C" void __real_syslog(int priority, const char* format, ...);

namespace {

void SendToTheSystemsLog(const std::string& line) {
  __real_syslog(LOG_ERR, "%s", line.c_str());
}

// What is sent last tells that everything before it has arrived, or never will.
std::string SystemsLog() {
  SendToTheSystemsLog("the end");
  std::string lines;
  for (int i = 0; i < 10000 && lines.find("the end") == std::string::npos; ++i) {
    usleep(1000);
    lines = ReadFile("/run/syslog.txt");
  }
  return lines;
}

}  // namespace

TEST(LogLineTest, SaysWhatItIsGiven) {
  errno = ENOENT;
  QUENDEL_LOG("a %s of %d and %ld, %.*s: %m", "text", 1, 2L, 3, "cut short");
  EXPECT_EQ(Message(), "a text of 1 and 2, cut: No such file or directory");
  EXPECT_EQ(errno, ENOENT);
}

TEST(LogLineTest, ChangesNoByteOfALineThatTheLogTakes) {
  const std::string text = TextOf(kLongest - std::string("unit:62 Failed [] now").size());
  QUENDEL_LOG("Failed [%s] now", text.c_str());
  EXPECT_EQ(LineLength(), kLongest);
  EXPECT_EQ(Message(), "Failed [" + text + "] now");
}

TEST(LogLineTest, ShortensTheTextOfALongerOneAndKeepsItsWords) {
  for (const size_t size : {kLongest, size_t{300000}, size_t{20000000}}) {
    ClearLog();
    QUENDEL_LOG("Failed [%s] now", TextOf(size).c_str());
    EXPECT_THAT(Message(), StartsWith("Failed [xxx"));
    EXPECT_THAT(Message(), EndsWith("xxx...] now"));
    EXPECT_LE(LineLength(), kLongest);
    EXPECT_GT(LineLength(), kLongest - 1000);
  }
}

TEST(LogLineTest, ShortensEachLongTextAndNoOther) {
  QUENDEL_LOG("(%s, %s) of '%s', ret = %d", TextOf(400000).c_str(), "short", TextOf(400000).c_str(),
              -7);
  EXPECT_THAT(Message(),
              testing::ContainsRegex("^.xxx+\\.\\.\\., short. of 'xxx+\\.\\.\\.', ret = -7$"));
  EXPECT_LE(LineLength(), kLongest);
}

TEST(LogLineTest, TellsTheErrorBehindALongText) {
  errno = EACCES;
  QUENDEL_LOG("%s %ld%% %.*s, err=%m", TextOf(400000).c_str(), 12345678901L, 2, "abc");
  EXPECT_THAT(Message(), EndsWith("xxx... 12345678901% ab, err=Permission denied"));
  EXPECT_EQ(errno, EACCES);
}

TEST(LogLineTest, CutsNoCharacterIntoPieces) {
  for (const char* front : {"", "x", "xx"}) {
    ClearLog();
    std::string text = front;
    while (text.size() < 400000) {
      text += "\xE2\x82\xAC";
    }
    QUENDEL_LOG("%s", text.c_str());
    EXPECT_THAT(Message(), EndsWith("\xE2\x82\xAC..."));
  }
}

TEST(LogLineTest, EvaluatesItsArgumentsOnce) {
  int count = 0;
  QUENDEL_LOG("%d %s", ++count, TextOf(400000).c_str());
  EXPECT_EQ(count, 1);
}

TEST(LogLineTest, NeedsNoMoreThanASmallStack) {
  pthread_attr_t attributes;
  ASSERT_EQ(pthread_attr_init(&attributes), 0);
  ASSERT_EQ(pthread_attr_setstacksize(&attributes, size_t{64} * 1024), 0);
  pthread_t thread;
  ASSERT_EQ(pthread_create(&thread, &attributes, LogLongText, nullptr), 0);
  ASSERT_EQ(pthread_join(thread, nullptr), 0);
  pthread_attr_destroy(&attributes);
  EXPECT_THAT(Message(), EndsWith("xxx...] now"));
}

// One that is as long as it may be arrives, and one of 400,000 bytes does not.
TEST(LogLineTest, IsNoLongerThanTheSystemsLogTakes) {
  QUENDEL_LOG("(%s)", TextOf(kLongest - std::string("unit:NNN ()").size()).c_str());
  ASSERT_EQ(LineLength(), kLongest);
  SendToTheSystemsLog("unit:NNN " + Message());
  SendToTheSystemsLog("dropped" + TextOf(400000));
  const std::string lines = SystemsLog();
  EXPECT_THAT(lines, HasSubstr("xxx)"));
  EXPECT_THAT(lines, Not(HasSubstr("dropped")));
}
