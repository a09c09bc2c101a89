// The server that takes some connections and refuses others.
#include "support/accept_pattern.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include "support/calls.h"

using namespace quendel::test;

namespace {

// One attempt for each counted sleep, as the reachability test makes them: "a" or "r" for each.
std::string Attempts(int count) {
  std::string outcomes;
  for (int i = 0; i < count; ++i) {
    if (i > 0) {
      sleep(1);
    }
    sockaddr_in server = {};
    server.sin_family = AF_INET;
    server.sin_port = htons(51790);
    server.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const int fd = socket(AF_INET, SOCK_STREAM, 0);
    outcomes += connect(fd, reinterpret_cast<sockaddr*>(&server), sizeof server) == 0 ? 'a' : 'r';
    close(fd);
  }
  return outcomes;
}

}  // namespace

TEST(AcceptPatternTest, FollowsItsPattern) {
  for (const char* pattern : {"aaaaaa", "rrrrrr", "ararar", "rarara", "aarraa", "rraarr"}) {
    const AcceptPattern server(pattern);
    EXPECT_EQ(Attempts(6), pattern);
  }
}

TEST(AcceptPatternTest, RefusesAfterItsPattern) {
  const AcceptPattern server("a");
  EXPECT_EQ(Attempts(3), "arr");
}

TEST(AcceptPatternTest, StopsListeningAtItsEnd) {
  { const AcceptPattern server("aa"); }
  EXPECT_EQ(Attempts(2), "rr");
}

TEST(AcceptPatternTest, CountsNoSocketOfItsOwn) {
  const AcceptPattern server("ar");
  EXPECT_EQ(Calls("socket"), 0);
}
