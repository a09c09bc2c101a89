// Reading and copying lines of any size in blocks.
#include "collectors/line_copy.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>

#include "base/file_io.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"

using namespace quendel;
using namespace quendel::test;

namespace {

constexpr char kSource[] = "/volume1/source";
constexpr char kSink[] = "/tmp/sink";

// Around the size of a block, which is 65536 bytes.
constexpr size_t kLengths[] = {0, 1, 2, 65534, 65535, 65536, 65537, 131071, 131072, 131073, 200000};

std::string LineOf(size_t length) {
  std::string line;
  while (line.size() < length) {
    line += static_cast<char>('a' + line.size() % 26);
  }
  return line;
}

OwnedFd Source(const std::string& text) {
  WriteFile(kSource, text);
  struct stat status = {};
  return OpenRegularFile(kSource, status);
}

OwnedFd Sink() {
  return OwnedFd(open(kSink, O_RDWR | O_CREAT | O_TRUNC, 0600));
}

void ExpectLine(const LineMark& line, const std::string& text, size_t end) {
  EXPECT_EQ(line.hash, Md5Of(text));
  EXPECT_EQ(line.length, static_cast<int64_t>(text.size()));
  EXPECT_EQ(line.end, static_cast<int64_t>(end));
}

// Copies and returns what has arrived; `taken` receives the number of bytes taken.
std::string Copy(const std::string& text, int64_t start, int64_t limit, int64_t& taken) {
  const OwnedFd source = Source(text);
  const OwnedFd sink = Sink();
  taken = CopyLines(source.get(), start, limit, sink.get());
  return ReadFile(kSink);
}

// What CopyLines() has to deliver, told line by line.
std::string CopyByLines(const std::string& text, size_t position, size_t limit, int64_t& taken) {
  const size_t start = position;
  std::string out;
  while (position < text.size() && (position == start || position < limit)) {
    const size_t newline = text.find('\n', position);
    out += text.substr(position, newline - position) + "\n";
    position = newline == std::string::npos ? text.size() : newline + 1;
  }
  taken = static_cast<int64_t>(position - start);
  return out;
}

// For the first call, the third and so on.
std::function<bool()> EveryOtherTime() {
  return [calls = 0]() mutable { return ++calls % 2 != 0; };
}

void FillTheDisk() {
  for (const char* way : {"copy_file_range", "sendfile", "write"}) {
    On(way).Return(-1, ENOSPC);
  }
}

}  // namespace

TEST(ReadLineTest, ReadsALineOfAnyLength) {
  for (const size_t length : kLengths) {
    const OwnedFd file = Source("ab\n" + LineOf(length) + "\nnext");
    LineMark line;
    ASSERT_EQ(ReadLine(file.get(), 3, line), ReadResult::kLine);
    ExpectLine(line, LineOf(length), 3 + length + 1);
  }
}

TEST(ReadLineTest, ReadsALastLineWithoutNewline) {
  for (const size_t length : kLengths) {
    const OwnedFd file = Source("ab\n" + LineOf(length));
    LineMark line;
    if (length == 0) {
      EXPECT_EQ(ReadLine(file.get(), 3, line), ReadResult::kNoLine);
      continue;
    }
    ASSERT_EQ(ReadLine(file.get(), 3, line), ReadResult::kLine);
    ExpectLine(line, LineOf(length), 3 + length);
  }
}

TEST(ReadLineTest, TakesEveryByteButTheNewline) {
  std::string text;
  for (int byte = 0; byte < 256; ++byte) {
    text += byte == '\n' ? "" : std::string(1, static_cast<char>(byte));
  }
  const OwnedFd file = Source(text + "\n");
  LineMark line;
  ASSERT_EQ(ReadLine(file.get(), 0, line), ReadResult::kLine);
  ExpectLine(line, text, 256);
}

TEST(ReadLineTest, FindsNoLineAtOrBehindTheEnd) {
  const OwnedFd file = Source("ab\n");
  LineMark line;
  EXPECT_EQ(ReadLine(file.get(), 3, line), ReadResult::kNoLine);
  EXPECT_EQ(ReadLine(file.get(), 4, line), ReadResult::kNoLine);
}

TEST(ReadLineTest, TellsAnErrorFromTheEnd) {
  const OwnedFd file = Source("ab\n");
  On("pread").Return(-1, EIO);
  LineMark line;
  EXPECT_EQ(ReadLine(file.get(), 0, line), ReadResult::kError);
}

TEST(ReadLineTest, ReadsOnAfterAnInterruptionAndAShortRead) {
  const OwnedFd file = Source(LineOf(100) + "\n");
  On("pread").Shorten(7);
  On("pread").When(EveryOtherTime()).Return(-1, EINTR);
  LineMark line;
  ASSERT_EQ(ReadLine(file.get(), 0, line), ReadResult::kLine);
  ExpectLine(line, LineOf(100), 101);
}

TEST(ReadLastLineTest, FindsALineOfAnyLengthFromTheEnd) {
  for (const size_t length : kLengths) {
    for (const size_t before : kLengths) {
      const OwnedFd file = Source(LineOf(before) + "\n" + LineOf(length) + "\n");
      LineMark line;
      ASSERT_EQ(ReadLastLine(file.get(), line), ReadResult::kLine);
      ExpectLine(line, LineOf(length), before + length + 2);
    }
  }
}

TEST(ReadLastLineTest, FindsALastLineWithoutNewline) {
  for (const size_t length : kLengths) {
    const OwnedFd file = Source("first\n" + LineOf(length));
    LineMark line;
    ASSERT_EQ(ReadLastLine(file.get(), line), ReadResult::kLine);
    ExpectLine(line, length == 0 ? "first" : LineOf(length), 6 + length);
  }
}

TEST(ReadLastLineTest, TakesTheOnlyLine) {
  LineMark line;
  ASSERT_EQ(ReadLastLine(Source("only").get(), line), ReadResult::kLine);
  ExpectLine(line, "only", 4);
  ASSERT_EQ(ReadLastLine(Source("\n").get(), line), ReadResult::kLine);
  ExpectLine(line, "", 1);
}

TEST(ReadLastLineTest, FindsNoLineInAnEmptyFile) {
  LineMark line;
  EXPECT_EQ(ReadLastLine(Source("").get(), line), ReadResult::kNoLine);
}

TEST(ReadLastLineTest, FailsWhenTheFileCannotBeRead) {
  const OwnedFd file = Source("a\nb\n");
  for (const int failing : {1, 2, 3}) {
    ResetCalls();
    On("pread").Nth(failing).Return(-1, EIO);
    LineMark line;
    EXPECT_EQ(ReadLastLine(file.get(), line), ReadResult::kError) << failing;
  }
  EXPECT_EQ(Calls("pread"), 3);
}

TEST(CopyLinesTest, CopiesLineByLineAsFarAsTheLimit) {
  const std::string texts[] = {"a\nbb\n\n\nccc\nd", "\n\n\n", "no newline at all",
                               LineOf(65536) + "\n" + LineOf(65535) + "\nend\n",
                               LineOf(200000) + "\n" + LineOf(3)};
  int cases = 0;
  for (const std::string& text : texts) {
    const size_t step = text.size() < 100 ? 1 : 13107;
    for (size_t start = 0; start <= text.size(); start += step) {
      for (size_t limit = 0; limit <= text.size() + step; limit += step) {
        int64_t taken = -1;
        int64_t expected = -1;
        ASSERT_EQ(Copy(text, static_cast<int64_t>(start), static_cast<int64_t>(limit), taken),
                  CopyByLines(text, start, limit, expected))
            << start << " to " << limit << " of " << text.substr(0, 30);
        ASSERT_EQ(taken, expected);
        ++cases;
      }
    }
  }
  EXPECT_GT(cases, 500);
}

TEST(CopyLinesTest, CopiesALineThatBeginsBelowTheLimitToItsEnd) {
  int64_t taken = 0;
  EXPECT_EQ(Copy("one\ntwo\nthree\n", 0, 5, taken), "one\ntwo\n");
  EXPECT_EQ(taken, 8);
  EXPECT_EQ(Copy("one\ntwo\nthree\n", 0, 4, taken), "one\n");
}

TEST(CopyLinesTest, TakesOneLineThatLiesBehindTheLimit) {
  int64_t taken = 0;
  EXPECT_EQ(Copy("one\ntwo\nthree\n", 4, 2, taken), "two\n");
}

TEST(CopyLinesTest, CopiesByWhicheverWayTheFileSystemsAllow) {
  const std::string text = LineOf(150000) + "\n" + LineOf(10) + "\n";
  for (const bool byRange : {true, false}) {
    for (const bool bySending : {true, false}) {
      ResetCalls();
      On("copy_file_range").When([=] { return !byRange; }).Return(-1, EXDEV);
      On("sendfile").When([=] { return !bySending; }).Return(-1, EINVAL);
      int64_t taken = 0;
      EXPECT_EQ(Copy(text, 0, static_cast<int64_t>(text.size()), taken), text);
      EXPECT_EQ(taken, static_cast<int64_t>(text.size()));
    }
  }
}

TEST(CopyLinesTest, GoesOnWhereAWayOfCopyingStopped) {
  const std::string text = LineOf(1000) + "\n";
  for (const char* way : {"copy_file_range", "sendfile"}) {
    On(way).Return(-1, EIO);
    On(way).Nth(1).Shorten(100);
    On(way).Nth(2).Shorten(100);
  }
  WriteFile("/tmp/source", text);  // where a range can be copied
  struct stat status = {};
  const OwnedFd source = OpenRegularFile("/tmp/source", status);
  const OwnedFd sink = Sink();
  EXPECT_EQ(CopyLines(source.get(), 0, 1001, sink.get()), 1001);
  EXPECT_EQ(ReadFile(kSink), text);
}

TEST(CopyLinesTest, TriesAgainAfterAnInterruption) {
  const std::string text = LineOf(1000) + "\n";
  for (const char* way : {"sendfile", "write", "pread"}) {
    On(way).Shorten(300);
    On(way).When(EveryOtherTime()).Return(-1, EINTR);
  }
  On("copy_file_range").Return(-1, EXDEV);
  int64_t taken = 0;
  EXPECT_EQ(Copy(text, 0, 1001, taken), text);
  EXPECT_GE(Calls("sendfile"), 8);

  On("sendfile").Return(-1, ENOSYS);
  EXPECT_EQ(Copy(text, 0, 1001, taken), text);
}

TEST(CopyLinesTest, FailsWhenNothingCanBeWritten) {
  FillTheDisk();
  int64_t taken = 0;
  Copy("one\ntwo\n", 0, 8, taken);
  EXPECT_LT(taken, 0);
}

TEST(CopyLinesTest, FailsWhenTheAddedNewlineCannotBeWritten) {
  On("write").Return(-1, ENOSPC);
  int64_t taken = 0;
  Copy("unfinished", 0, 10, taken);
  EXPECT_LT(taken, 0);
}

TEST(CopyLinesTest, TellsAnErrorFromTheEnd) {
  for (const int failing : {1, 2}) {
    ResetCalls();
    On("pread").Nth(failing).Return(-1, EIO);
    int64_t taken = 0;
    Copy("one\ntwo\n", 0, 8, taken);
    EXPECT_LT(taken, 0) << failing;
  }
}

TEST(CopyLinesTest, EndsWithTheSourceThatShrinksMeanwhile) {
  On("copy_file_range").Before([] { std::filesystem::resize_file(kSource, 6); }).Return(-1, EXDEV);
  int64_t taken = 0;
  EXPECT_EQ(Copy("one\ntwo\nthree\n", 0, 14, taken), "one\ntw\n");
  EXPECT_EQ(taken, 6);
}

TEST(CopyLinesTest, TakesNothingThatArrivesMeanwhile) {
  On("copy_file_range").Before([] { WriteFile(kSource, "one\ntwo and more\n"); }).Return(-1, EXDEV);
  int64_t taken = 0;
  EXPECT_EQ(Copy("one\ntwo", 0, 7, taken), "one\ntwo\n");
  EXPECT_EQ(taken, 7);
}

TEST(CopyWholeTest, AddsAllOfTheSourceBehindWhatIsThere) {
  const std::string text = LineOf(200000);
  const OwnedFd source = Source(text);
  const OwnedFd sink = Sink();
  ASSERT_EQ(write(sink.get(), "before", 6), 6);
  EXPECT_TRUE(CopyWhole(source.get(), sink.get()));
  EXPECT_EQ(ReadFile(kSink), "before" + text);
}

TEST(CopyWholeTest, FailsWhenNothingCanBeWritten) {
  FillTheDisk();
  EXPECT_FALSE(CopyWhole(Source("text").get(), Sink().get()));
}
