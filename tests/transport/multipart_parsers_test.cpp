// What a posted form is to parsers that others wrote.
#include <gmock/gmock.h>

#include <cstdlib>
#include <sstream>

#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"
#include "support/multipart.h"
#include "support/server.h"

using namespace quendel::test;

namespace {

constexpr char kUrl[] = "https://support.test/collect/a1";

int Describe(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["filename"] = item.path;
  return 0;
}

std::string EveryByteTwice() {
  std::string bytes;
  for (int i = 0; i < 512; ++i) {
    bytes.push_back(static_cast<char>(i));
  }
  return bytes;
}

// File names and contents that a careless writer or reader of forms gets wrong.
const std::vector<std::pair<std::string, std::string>> kFiles = {
    {"run.tar.xz", EveryByteTwice()}, {"empty.txt", ""},
    {"two words.txt", "\r\n\r\n"},    {"looks-like-an-end", "--\r\n--boundary--\r\n"},
    {"caf\xC3\xA9.txt", "\n"},        {"large.xz", std::string(2 << 20, '\r')},
};

// Posts the files and leaves the request's body in /tmp/body. Returns its content type.
std::string CaptureRequest() {
  std::vector<QUENDELSendDataParam_t> items;
  for (const auto& [name, bytes] : kFiles) {
    WriteFile("/tmp/" + name, bytes);
    items.emplace_back().path = "/tmp/" + name;
  }
  EXPECT_EQ(QUENDELPostFileToServer(kUrl, "file", items, Describe), 0);
  WriteFile("/tmp/body", Requests().at(0).body);
  return Header(Requests()[0], "Content-Type");
}

// Lets a parser take the request apart and compares what it found.
void ExpectSameParts(const std::string& parser) {
  const std::string type = CaptureRequest();
  WriteFile("/tmp/parts/.folder", "");
  const std::string command = std::string(PARSERS_DIR) + "/" + parser + " '" + type +
                              "' /tmp/body /tmp/parts > /tmp/listing";
  ASSERT_EQ(system(command.c_str()), 0) << command;

  std::istringstream listing(ReadFile("/tmp/listing"));
  std::string line;
  size_t number = 0;
  for (const auto& [name, bytes] : kFiles) {
    const bool text = name.find(".txt") != std::string::npos;
    std::getline(listing, line);
    EXPECT_EQ(line, "file|" + name + "|" + (text ? "text/plain" : "application/octet-stream"));
    EXPECT_TRUE(ReadFile("/tmp/parts/" + std::to_string(number++)) == bytes) << name;
  }
  std::getline(listing, line);
  EXPECT_EQ(line, "file|-|-");
  const Json::Value list = JsonOf(ReadFile("/tmp/parts/" + std::to_string(number)));
  EXPECT_EQ(list.size(), kFiles.size());
  EXPECT_FALSE(std::getline(listing, line)) << line;
}

}  // namespace

TEST(MultipartParsersTest, PythonsEmailPackageFindsTheSameParts) {
  ExpectSameParts("python_email");
}

TEST(MultipartParsersTest, WerkzeugFindsTheSameParts) {
  ExpectSameParts("python_werkzeug");
}

TEST(MultipartParsersTest, PerlsHttpMessageFindsTheSameParts) {
  ExpectSameParts("perl_http_message");
}

TEST(MultipartParsersTest, PerlsCgiFindsTheSameParts) {
  ExpectSameParts("perl_cgi");
}
