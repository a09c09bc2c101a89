// Holds docs/protocol.md against the library: each exchange is made, with the reply of the page,
// and what the server received is compared with the request of the page. So are the tables of
// replies.
//
// A fenced block "```http NAME" is a request, "```http NAME-reply" what it is answered with.
#include <gmock/gmock.h>

#include <algorithm>
#include <regex>
#include <sstream>

#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::IsEmpty;
using testing::SizeIs;
using testing::UnorderedElementsAreArray;

namespace {

// ---- The page

std::vector<std::string> PageLines() {
  std::istringstream page(ReadFile(PAGE));
  std::vector<std::string> lines;
  for (std::string line; std::getline(page, line);) {
    lines.push_back(line);
  }
  return lines;
}

// The fenced blocks of HTTP, by their names. Their lines end in CR LF, the last in nothing.
std::map<std::string, std::string> Blocks() {
  const std::string fence = "```http ";
  std::map<std::string, std::string> blocks;
  std::string name;
  for (const std::string& line : PageLines()) {
    if (line.rfind(fence, 0) == 0) {
      name = line.substr(fence.size());
      EXPECT_EQ(blocks.count(name), 0U) << "two blocks are named " << name;
      blocks[name];
    } else if (line == "```") {
      name.clear();
    } else if (!name.empty()) {
      blocks[name] += (blocks[name].empty() ? "" : "\r\n") + line;
    }
  }
  return blocks;
}

// The rows of the first table below a heading, each with its cells as they are shown.
std::vector<std::vector<std::string>> Table(const std::string& heading) {
  std::vector<std::vector<std::string>> rows;
  bool found = false;
  for (const std::string& line : PageLines()) {
    if (line == heading) {
      found = true;
    } else if (found && !line.empty() && line[0] == '|') {
      rows.emplace_back();
      std::istringstream cells(line.substr(1));
      for (std::string cell; std::getline(cells, cell, '|');) {
        rows.back().push_back(std::regex_replace(cell, std::regex("^ *`?|`? *$"), ""));
      }
    } else if (!rows.empty()) {
      break;
    }
  }
  EXPECT_THAT(rows, SizeIs(testing::Gt(2U))) << "no table below " << heading;
  rows.erase(rows.begin(), rows.begin() + 2);  // its head
  return rows;
}

void ReplaceAll(std::string& text, const std::string& what, const std::string& with) {
  for (size_t at = 0; (at = text.find(what, at)) != std::string::npos; at += with.size()) {
    text.replace(at, what.size(), with);
  }
}

// Puts what was sent in the place of each mark, the guillemets and the name between them, of a
// request of the page. The result is what was sent if, but for the marks, the page is right. Only a
// mark that begins with "contents" may stand for more than one line.
std::string WithMarksFilled(std::string page, const std::string& sent) {
  const std::string opening = "«";
  const std::string closing = "»";
  // What was filled in may hold the bytes of a guillemet, so the search goes on behind it.
  for (size_t at = 0; (at = page.find(opening, at)) != std::string::npos;) {
    const size_t end = page.find(closing, at);
    const std::string mark = page.substr(at, end + closing.size() - at);
    const size_t after = at + mark.size();
    const std::string next = page.substr(after, page.find(opening, after) - after);
    const size_t stop = sent.find(next, at);
    if (end == std::string::npos || stop == std::string::npos) {
      break;
    }
    const std::string text = sent.substr(at, stop - at);
    const bool lines = mark.rfind(opening + "contents", 0) == 0;
    if (text.empty() || (!lines && text.find('\n') != std::string::npos)) {
      break;
    }
    ReplaceAll(page, mark, text);
    at += text.size();
  }
  return page;
}

// ---- What the page tells of

void SetUpTheDeviceOfThePage() {
  setenv("TZ", "Europe/Berlin", 1);
  SetIdentity({{"serial_number", "SN0042"},
               {"account_email", "owner@example.com"},
               {"account_field_a", "aaaa"},
               {"account_field_b", "bbbb"},
               {"timezone", "Europe/Berlin"}});
}

int ReportNoFile() {
  return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, Json::Value(Json::arrayValue));
}

int ReportEnable() {
  WriteFile("/usr/arvo/etc/quendel.conf",
            R"(contact=[{"name":"Owner","mail":"owner@example.com"}])");
  Json::Value reply;
  const int result =
      QUENDELPostEventToServer(QUENDEL_EVENT_ENABLE, reply, JsonOf(R"({"model":"TEST-1"})"));
  EXPECT_EQ(reply, JsonOf(R"({"success":true,"note":"welcome"})"));
  return result;
}

int ReportReboot() {
  RemoveFile("/usr/arvo/etc/quendel.conf");
  Json::Value reply;
  return QUENDELPostEventToServer(QUENDEL_EVENT_REBOOT, reply, "not sent");
}

int Heartbeat() {
  Json::Value actions;
  const int result = QUENDELHeartbeat(actions);
  EXPECT_EQ(actions, JsonOf(R"([{"action":"upload_file","request_id":17,"progress":1,"files":[
      {"file_type":"coredump","file_path":"/volume1/@app.core","file_uuid":"u-1"}]}])"));
  return result;
}

int SendArchive() {
  const std::string archive = "/tmp/quendel_20240305_080809_0.tar.xz";
  WriteFile(archive, "any\r\n--«bytes»");
  return QUENDELSendCollectData(archive.c_str(), 1709622489);
}

int SendRequestedFiles() {
  WriteFile("/volume1/@app.core", "a dump");
  return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, JsonOf(R"([
      {"file_type":"coredump","file_path":"/volume1/@app.core","file_uuid":"u-1"},
      {"file_type":"debug.dat","file_path":"","file_uuid":"u-2"}])"));
}

struct Exchange {
  std::string name;
  int (*make)();
};

const Exchange kExchanges[] = {
    {"heartbeat", Heartbeat},      {"progress", ReportNoFile}, {"event", ReportEnable},
    {"other-event", ReportReboot}, {"collect", SendArchive},   {"upload", SendRequestedFiles},
};

// What a reply of the page is to the server of the tests.
ScriptedAnswer AnswerFrom(const std::string& reply) {
  ScriptedAnswer answer;
  const size_t blank = reply.find("\r\n\r\n");
  EXPECT_NE(blank, std::string::npos) << reply;
  EXPECT_EQ(sscanf(reply.c_str(), "HTTP/1.1 %d ", &answer.status), 1) << reply;
  answer.body = reply.substr(blank + 4);
  return answer;
}

// ---- The tables of replies

// Queues the answer of a table's row: the status and the body, or a connection that just ends.
void AnswerAs(const std::vector<std::string>& row) {
  if (row[0] == "none") {
    Answer({.cut_after = 0});
  } else {
    Answer({.status = std::stoi(row[0]), .body = row[1]});
  }
}

// The log as the tables show it.
std::string LogCell() {
  std::string cell;
  for (const LogLine& line : Log()) {
    cell += (cell.empty() ? "" : "`<br>`") + line.unit + ": " + line.message;
  }
  return cell;
}

// Plays each row of a table to a function that posts.
void ExpectTable(const std::string& heading, int (*post)()) {
  SetUpTheDeviceOfThePage();
  for (const std::vector<std::string>& row : Table(heading)) {
    ASSERT_THAT(row, SizeIs(4));
    AnswerAs(row);
    ClearLog();
    EXPECT_EQ(post(), std::stoi(row[2])) << row[0] << " " << row[1];
    EXPECT_EQ(LogCell(), row[3]) << row[0] << " " << row[1];
  }
}

class ProtocolPageTest : public testing::TestWithParam<Exchange> {};

std::string NameOf(const testing::TestParamInfo<Exchange>& exchange) {
  std::string name = exchange.param.name;
  name.erase(std::remove(name.begin(), name.end(), '-'), name.end());
  return name;
}

}  // namespace

TEST_P(ProtocolPageTest, ShowsTheRequestThatIsSent) {
  SetUpTheDeviceOfThePage();
  const std::map<std::string, std::string> blocks = Blocks();
  std::string page = blocks.at(GetParam().name);
  if (page.find("multipart/form-data") != std::string::npos) {
    page += "\r\n";
  }
  Answer(AnswerFrom(blocks.at(GetParam().name + "-reply")));
  EXPECT_EQ(GetParam().make(), 0);
  EXPECT_THAT(Log(), IsEmpty());
  ASSERT_THAT(Requests(), SizeIs(1));
  const std::string sent = Requests()[0].raw;
  EXPECT_EQ(WithMarksFilled(page, sent), sent);
}

INSTANTIATE_TEST_SUITE_P(Each, ProtocolPageTest, testing::ValuesIn(kExchanges), NameOf);

TEST(ProtocolPageTest, HasNoBlockThatIsNotHeld) {
  std::vector<std::string> held;
  for (const Exchange& exchange : kExchanges) {
    held.push_back(exchange.name);
    held.push_back(exchange.name + "-reply");
  }
  std::vector<std::string> shown;
  for (const auto& [name, block] : Blocks()) {
    shown.push_back(name);
  }
  EXPECT_THAT(shown, UnorderedElementsAreArray(held));
}

TEST(ProtocolPageTest, TellsWhatEachReplyToAJsonPostDoes) {
  ExpectTable("### To a JSON post", [] {
    Json::Value actions;
    return QUENDELHeartbeat(actions);
  });
}

TEST(ProtocolPageTest, TellsWhatEachReplyToAFilePostDoes) {
  ExpectTable("### To a file post", [] { return QUENDELSendUploadData(17, {}); });
}

TEST(ProtocolPageTest, TellsTheWebApiErrorOfEachCode) {
  for (const std::vector<std::string>& row : Table("### The server's codes")) {
    ASSERT_THAT(row, SizeIs(2));
    EXPECT_EQ(QUENDELGetWebapiError(std::stoi(row[0])), std::stoi(row[1])) << row[0];
  }
}
