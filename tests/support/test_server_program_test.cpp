// The scripted HTTPS server as a program that somebody starts by hand.
#include <gmock/gmock.h>
#include <sys/wait.h>

#include <chrono>
#include <cstdlib>
#include <thread>

#include "support/appliance.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::StartsWith;

namespace {

struct Outcome {
  int status;
  std::string output;
};

Outcome Shell(const std::string& command) {
  const int status = system(("{ " + command + "; } >/tmp/output 2>&1").c_str());
  return {WEXITSTATUS(status), ReadFile("/tmp/output")};
}

Outcome Server(const std::string& options) {
  return Shell("timeout 5 " TEST_SERVER " " + options);
}

// A server that runs until the end of the test, with its files in /tmp/server.
class Running {
 public:
  explicit Running(const std::string& options) {
    Shell(TEST_SERVER " --dir /tmp/server " + options +
          " >/tmp/server.txt 2>&1 & echo $! >/tmp/pid");
    for (int i = 0; i < 500 && Shell("curl -sk https://localhost:51791/").status != 0; ++i) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
  }
  ~Running() { Shell("kill $(cat /tmp/pid)"); }
  Running(const Running&) = delete;
  Running& operator=(const Running&) = delete;
};

}  // namespace

TEST(TestServerProgramTest, ExplainsItself) {
  const Outcome outcome = Server("--help");
  EXPECT_EQ(outcome.status, 0);
  EXPECT_THAT(outcome.output, StartsWith("Usage: test_server [OPTION...]\n"));
}

TEST(TestServerProgramTest, RefusesWhatItDoesNotUnderstand) {
  for (const char* options : {"--nosuch x", "--port", "--port 0", "--port 65536", "--port 1x",
                              "--port -1", "--cert self-singed"}) {
    const Outcome outcome = Server(options);
    EXPECT_EQ(outcome.status, 1) << options;
    EXPECT_THAT(outcome.output, StartsWith("test_server: ")) << options;
  }
}

TEST(TestServerProgramTest, ListensWhereItIsTold) {
  const Running server("--port 51791");
  const Outcome outcome = Shell("curl -sk https://127.0.0.1:51791/path");
  EXPECT_EQ(outcome.output, "{\"success\":true}");
  EXPECT_THAT(ReadFile("/tmp/server/requests/00000002.http"), StartsWith("GET /path HTTP/1.1\r\n"));
  EXPECT_THAT(ReadFile("/tmp/server.txt"), HasSubstr("GET /path HTTP/1.1\n"));
}

TEST(TestServerProgramTest, SaysWhenThePortIsTaken) {
  const Running server("--port 51791");
  const Outcome outcome = Server("--port 51791");
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.output, "test_server: cannot listen on port 51791: Address already in use\n");
}

TEST(TestServerProgramTest, ShowsTheNameAndTheCertificateItIsTold) {
  const Running server("--port 51791 --host a.example --cert expired");
  const Outcome outcome = Shell(
      "openssl s_client -connect 127.0.0.1:51791 </dev/null 2>/dev/null"
      " | openssl x509 -noout -subject -checkend 0");
  EXPECT_EQ(outcome.output, "subject=CN = a.example\nCertificate will expire\n");
}

TEST(TestServerProgramTest, TakesAnswersWrittenByHand) {
  const Running server("--port 51791");
  WriteFile("/tmp/draft", "status 201\nheader X-Mine: a: b\nfill 2\ntail 1\n\ntext!");
  Shell("mv /tmp/draft /tmp/server/answers/any-name");
  EXPECT_EQ(Shell("curl -ski https://localhost:51791/").output,
            "HTTP/1.1 201 Scripted\r\nContent-Length: 7\r\nConnection: close\r\n"
            "X-Mine: a: b\r\n\r\ntextxx!");
}

TEST(TestServerProgramTest, SaysWhenAFileIsNoAnswer) {
  for (const char* text : {"nonsense 1\n\n", "status x\n\n", "header \n\n", "tail 5\n\n1234"}) {
    const Running server("--port 51791");
    WriteFile("/tmp/draft", text);
    Shell("mv /tmp/draft /tmp/server/answers/wrong");
    EXPECT_NE(Shell("curl -sk https://localhost:51791/").status, 0) << text;
    EXPECT_THAT(ReadFile("/tmp/server.txt"),
                HasSubstr("test_server: not an answer: /tmp/server/answers/wrong\n"))
        << text;
  }
}
