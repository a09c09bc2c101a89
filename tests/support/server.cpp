// The test's side of the scripted HTTPS server: answers go to it, and requests come back, as files.
#include "support/server.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>

#include "support/answer_file.h"
#include "support/appliance.h"
#include "support/require.h"

namespace quendel::test {
namespace {

namespace fs = std::filesystem;

constexpr char kLineEnd[] = "\r\n";

fs::path Folder() {
  Require(fs::is_directory(kServerFolder),
          "no server: register this test with quendel_test(... SERVER)");
  return kServerFolder;
}

// The server sees nothing or the whole file.
void Hand(const fs::path& file, const std::string& text) {
  const fs::path draft = Folder() / "draft";
  WriteFile(draft, text);
  fs::rename(draft, file);
}

// Takes what is before the next line end off `rest`.
std::string TakeLine(std::string& rest) {
  const size_t end = rest.find(kLineEnd);
  Require(end != std::string::npos, "a request's line has no end");
  std::string line = rest.substr(0, end);
  rest.erase(0, end + 2);
  return line;
}

std::string WithoutChunks(std::string framed) {
  std::string body;
  while (const size_t size = std::stoul(TakeLine(framed), nullptr, 16)) {
    body.append(framed, 0, size);
    framed.erase(0, size + 2);
  }
  return body;
}

Request RequestFrom(const std::string& raw) {
  Request request;
  request.raw = raw;
  std::string rest = raw;
  request.line = TakeLine(rest);
  bool chunked = false;
  for (std::string line; !(line = TakeLine(rest)).empty();) {
    const size_t colon = line.find(':');
    Require(colon != std::string::npos, "a request's header has no colon: " + line);
    const size_t value = line.find_first_not_of(' ', colon + 1);
    request.headers.emplace_back(line.substr(0, colon),
                                 value == std::string::npos ? "" : line.substr(value));
    chunked = chunked || line == "Transfer-Encoding: chunked";
  }
  request.body = chunked ? WithoutChunks(rest) : rest;
  return request;
}

}  // namespace

void Answer(const ScriptedAnswer& answer) {
  static int queued = 0;
  char name[16];
  snprintf(name, sizeof name, "%08d", ++queued);
  Hand(Folder() / "answers" / name, TextFromAnswer(answer));
}

std::vector<std::string> RequestLines() {
  std::vector<std::string> lines;
  for (const Request& request : Requests()) {
    lines.push_back(request.line);
  }
  return lines;
}

std::string RequestLine() {
  const std::vector<std::string> lines = RequestLines();
  EXPECT_EQ(lines.size(), 1U);
  return lines.at(0);
}

std::vector<std::string> RequestFiles() {
  std::vector<std::string> files;
  for (const fs::directory_entry& entry : fs::directory_iterator(Folder() / "requests")) {
    if (entry.path().extension() == ".http") {
      files.push_back(entry.path());
    }
  }
  std::sort(files.begin(), files.end());
  return files;
}

std::vector<Request> Requests() {
  std::vector<Request> requests;
  for (const std::string& file : RequestFiles()) {
    requests.push_back(RequestFrom(ReadFile(file)));
  }
  return requests;
}

void UseCertificate(const std::string& kind) {
  Require(kind == "self-signed" || kind == "expired" || kind == "wrong-host",
          "no certificate of the kind " + kind);
  Hand(Folder() / "certificate", kind);
}

}  // namespace quendel::test
