// The reader of forms: what it makes of what the library sends, however it comes in, and of what
// nobody should send.
#include "multipart.h"

#include <gmock/gmock.h>

#include <cstdlib>
#include <sstream>

#include "quendel.h"
#include "support/appliance.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;
using quendeldesk::BoundaryOf;
using quendeldesk::MultipartReader;
using quendeldesk::PartHead;

namespace {

struct Part {
  std::string name;
  std::string filename;  // "-" for a text
  std::string type;      // "-" for none
  std::string bytes;
  bool ended = false;
};
bool operator==(const Part& left, const Part& right) {
  return left.name == right.name && left.filename == right.filename && left.type == right.type &&
         left.bytes == right.bytes && left.ended == right.ended;
}
std::ostream& operator<<(std::ostream& out, const Part& part) {
  return out << part.name << "|" << part.filename << "|" << part.type << "|" << part.bytes.size();
}

class Collector : public quendeldesk::PartSink {
 public:
  void BeginPart(const PartHead& head) override {
    parts.push_back({head.name, head.filename.value_or("-"),
                     head.content_type.empty() ? "-" : head.content_type, "", false});
  }
  void PartBytes(std::string_view bytes) override { parts.back().bytes.append(bytes); }
  void EndPart() override { parts.back().ended = true; }

  std::vector<Part> parts;
};

struct Read {
  std::vector<Part> parts;
  bool good = true;
  bool complete = false;
};

Read ReadForm(const std::string& boundary, const std::string& body, size_t step) {
  Collector collector;
  MultipartReader reader(boundary, collector);
  Read read;
  for (size_t at = 0; at < body.size(); at += step) {
    read.good = reader.Take(body.substr(at, step)) && read.good;
  }
  read.complete = reader.complete();
  read.parts = collector.parts;
  return read;
}

// Reads it in pieces of every small size, which must come to the same.
Read ReadInPieces(const std::string& boundary, const std::string& body) {
  const Read whole = ReadForm(boundary, body, body.size());
  for (size_t step = 1; step < 80; ++step) {
    const Read pieces = ReadForm(boundary, body, step);
    EXPECT_EQ(pieces.good, whole.good) << step;
    EXPECT_EQ(pieces.complete, whole.complete) << step;
    EXPECT_EQ(pieces.parts, whole.parts) << step;
  }
  return whole;
}

std::string PartOf(const std::string& head, const std::string& bytes) {
  return "--B\r\n" + head + "\r\n\r\n" + bytes + "\r\n";
}
const std::string kHead = "Content-Disposition: form-data; name=\"file\"; filename=\"a\"";

int Describe(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["filename"] = item.path;
  return 0;
}

// What a careless writer or reader of forms gets wrong.
const std::vector<std::pair<std::string, std::string>> kFiles = {
    {"run.tar.xz", std::string("\0\1\r\n\xff", 5)},
    {"empty.txt", ""},
    {"empty2.txt", ""},
    {"two words.txt", "\r\n\r\n"},
    {"looks-like-an-end", "--\r\n--boundary--\r\n"},
    {"caf\xC3\xA9.txt", "\r"},
    {"q\"uote", "\r\n--"},
    {"back\\slash", "\n"},
};

// Parsers differ over names with these two characters: a "%22" may be the name's own.
bool IsPlain(const std::string& name) {
  return name.find_first_of("\"\\") == std::string::npos;
}

Request RecordedRequest(bool plainNames) {
  std::vector<QUENDELSendDataParam_t> items;
  for (const auto& [name, bytes] : kFiles) {
    if (plainNames && !IsPlain(name)) {
      continue;
    }
    WriteFile("/tmp/" + name, bytes);
    items.emplace_back().path = "/tmp/" + name;
  }
  EXPECT_EQ(QUENDELPostFileToServer("https://support.test/collect/a1", "file", items, Describe), 0);
  return Requests().at(0);
}

std::string ListingOf(const std::vector<Part>& parts) {
  std::ostringstream listing;
  for (const Part& part : parts) {
    listing << part.name << "|" << part.filename << "|" << part.type << "\n";
  }
  return listing.str();
}

void ExpectSameParts(const std::string& parser) {
  const Request request = RecordedRequest(true);
  const std::string type = Header(request, "Content-Type");
  const std::vector<Part> parts = ReadInPieces(BoundaryOf(type), request.body).parts;
  ASSERT_GT(parts.size(), 5U);
  WriteFile("/tmp/body", request.body);
  WriteFile("/tmp/parts/.folder", "");
  const std::string command = std::string(PARSERS_DIR) + "/" + parser + " '" + type +
                              "' /tmp/body /tmp/parts > /tmp/listing";
  ASSERT_EQ(system(command.c_str()), 0) << command;
  EXPECT_EQ(ReadFile("/tmp/listing"), ListingOf(parts));
  for (size_t i = 0; i < parts.size(); ++i) {
    EXPECT_EQ(ReadFile("/tmp/parts/" + std::to_string(i)), parts[i].bytes);
  }
}

}  // namespace

TEST(MultipartReaderTest, TakesTheLibrarysFormsApart) {
  const Request request = RecordedRequest(false);
  const Read read = ReadInPieces(BoundaryOf(Header(request, "Content-Type")), request.body);
  EXPECT_TRUE(read.complete);
  ASSERT_EQ(read.parts.size(), kFiles.size() + 1);
  for (size_t i = 0; i < kFiles.size(); ++i) {
    EXPECT_EQ(read.parts[i].filename, kFiles[i].first);
    EXPECT_EQ(read.parts[i].bytes, kFiles[i].second) << kFiles[i].first;
    EXPECT_TRUE(read.parts[i].ended);
  }
  EXPECT_EQ(read.parts.back().filename, "-");
}

TEST(MultipartReaderTest, FindsWhatPythonsEmailPackageFinds) {
  ExpectSameParts("python_email");
}

TEST(MultipartReaderTest, FindsWhatWerkzeugFinds) {
  ExpectSameParts("python_werkzeug");
}

TEST(MultipartReaderTest, TakesABoundaryOnlyForOneWhenItsLineEnds) {
  const Read read = ReadInPieces("B", PartOf(kHead, "x\r\n--Bx\r\n--B -\r\n--B-x") + "--B \t--x");
  EXPECT_TRUE(read.good);
  EXPECT_FALSE(read.complete);
  ASSERT_EQ(read.parts.size(), 1U);
  EXPECT_FALSE(read.parts[0].ended);
}

TEST(MultipartReaderTest, TakesBlanksBehindABoundary) {
  const Read read = ReadInPieces(
      "B", "--B \t\r\n" + kHead + "\r\n\r\nx\r\n--B  \r\n" + kHead + "\r\n\r\n\r\n--B--more");
  EXPECT_TRUE(read.complete);
  ASSERT_EQ(read.parts.size(), 2U);
  EXPECT_EQ(read.parts[0].bytes, "x");
}

TEST(MultipartReaderTest, PassesOverWhatIsBeforeTheFirstBoundary) {
  const Read read = ReadInPieces("B", "preamble\r\n" + PartOf(kHead, "x") + "--B--");
  EXPECT_TRUE(read.complete);
  ASSERT_EQ(read.parts.size(), 1U);
}

TEST(MultipartReaderTest, IsNotCompleteWithoutTheClosingBoundary) {
  EXPECT_FALSE(ReadInPieces("B", PartOf(kHead, "x")).complete);
  EXPECT_FALSE(ReadInPieces("B", PartOf(kHead, "x") + "--B-").complete);
  EXPECT_FALSE(ReadInPieces("B", "no form at all").complete);
}

TEST(MultipartReaderTest, RefusesPartsThatAreNoFormData) {
  EXPECT_FALSE(ReadInPieces("B", "--B\r\n\r\nx\r\n--B--").good);
  EXPECT_FALSE(ReadInPieces("B", PartOf("Content-Disposition: attachment", "x") + "--B--").good);
  EXPECT_FALSE(ReadInPieces("B", PartOf("X: y", "x") + "--B--").good);
}

TEST(MultipartReaderTest, RefusesAHeadThatIsTooLong) {
  const std::string longHead = kHead + "\r\nX: " + std::string(9000, 'x');
  EXPECT_FALSE(ReadForm("B", PartOf(longHead, "x") + "--B--", 100).good);
  EXPECT_FALSE(ReadForm("B", "--B\r\n" + std::string(9000, 'x'), 100).good);
}

TEST(MultipartReaderTest, ReadsTheWaysToWriteAHead) {
  const Read read = ReadInPieces(
      "B",
      PartOf("content-DISPOSITION:form-data;filename=plain ; NAME=n\r\nCONTENT-type: \ta/b ", "x") +
          PartOf("Content-Disposition: form-data; name=\"a;b=\\\"c\\\\\"; filename=\"\"", "") +
          "--B--");
  ASSERT_EQ(read.parts.size(), 2U);
  EXPECT_EQ(read.parts[0].filename, "plain");
  EXPECT_EQ(read.parts[0].name, "n");
  EXPECT_EQ(read.parts[0].type, "a/b");
  EXPECT_EQ(read.parts[1].name, "a;b=\"c\\");
  EXPECT_EQ(read.parts[1].filename, "");
}

TEST(BoundaryOfTest, ReadsTheBoundaryOfAForm) {
  EXPECT_EQ(BoundaryOf("multipart/form-data; boundary=abc"), "abc");
  EXPECT_EQ(BoundaryOf("Multipart/Form-Data; charset=x; boundary=\"a b\""), "a b");
  EXPECT_EQ(BoundaryOf("multipart/form-data"), "");
  EXPECT_EQ(BoundaryOf("application/json; boundary=abc"), "");
  EXPECT_EQ(BoundaryOf("multipart/form-data; boundary=" + std::string(300, 'x')), "");
}
