// The connect test: pairs of successes within six attempts.
#include <gmock/gmock.h>
#include <netdb.h>
#include <sys/socket.h>

#include <cerrno>

#include "quendel.h"
#include "support/accept_pattern.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"

using namespace quendel::test;
using testing::AllOf;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

constexpr char kUnit[] = "util.cpp";
constexpr char kRefused[] = "connect to a socket failed, errno: Connection refused";

// One run of the test against a server that accepts (a) and refuses (r) in this order.
struct Outcome {
  int result;
  int attempts;
  int slept_seconds;
};

Outcome Against(const std::string& pattern) {
  AcceptPattern server(pattern);
  const int result = QUENDELIsServerReachable();
  return {result, Calls("connect"), SleptSeconds()};
}

void ExpectOutcome(const std::string& pattern, int result, int attempts) {
  const Outcome outcome = Against(pattern);
  EXPECT_EQ(outcome.result, result);
  EXPECT_EQ(outcome.attempts, attempts);
  EXPECT_EQ(outcome.slept_seconds, attempts - 1);
}

}  // namespace

TEST(IsServerReachableTest, IsTrueAfterTwoConnectionsASecondApart) {
  ExpectOutcome("aaaaaa", 1, 2);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(IsServerReachableTest, CountsOnlyConnectionsInARow) {
  ExpectOutcome("araaaa", 1, 4);
  EXPECT_THAT(Log(), ElementsAre(Logged(kUnit, kRefused)));
}

TEST(IsServerReachableTest, TakesAPairAtTheLastTwoAttempts) {
  ExpectOutcome("rrrraa", 1, 6);
}

TEST(IsServerReachableTest, IsFalseWhenOnlyTheSixthAttemptSucceeds) {
  ExpectOutcome("rrrrra", 0, 6);
  EXPECT_THAT(Log(), AllOf(SizeIs(5), Each(Logged(kUnit, kRefused))));
}

TEST(IsServerReachableTest, IsFalseWhenSuccessesAlternate) {
  ExpectOutcome("ararar", 0, 6);
}

TEST(IsServerReachableTest, IsFalseWhenSuccessesAlternateTheOtherWay) {
  ExpectOutcome("rarara", 0, 6);
}

TEST(IsServerReachableTest, IsFalseWhenEveryAttemptFails) {
  ExpectOutcome("rrrrrr", 0, 6);
  EXPECT_THAT(Log(), SizeIs(6));
}

TEST(IsServerReachableTest, LeavesTheSocketsOfFailedAttemptsOpen) {
  AcceptPattern server("rrrrrr");
  const int before = OpenDescriptors();
  Record("socket");
  QUENDELIsServerReachable();
  EXPECT_EQ(OpenDescriptors(), before + 6);
  // None of them gets into a program that the process starts later.
  const std::string closedOnExec =
      std::to_string(AF_INET) + "|" + std::to_string(SOCK_STREAM | SOCK_CLOEXEC) + "|0";
  EXPECT_THAT(Recorded(), Each(closedOnExec));
}

TEST(IsServerReachableTest, CountsASocketThatCannotBeHadAsAFailedAttempt) {
  On("socket").Return(-1, EMFILE);
  EXPECT_EQ(QUENDELIsServerReachable(), 0);
  EXPECT_THAT(Log(), AllOf(SizeIs(6), Each(Logged(kUnit,
                                                  "connect to a socket failed, errno: "
                                                  "Bad file descriptor"))));
  EXPECT_EQ(SleptSeconds(), 5);
}

TEST(IsServerReachableTest, ClosesTheSocketsOfConnections) {
  AcceptPattern server("aaaaaa");
  const int before = OpenDescriptors();
  ASSERT_EQ(QUENDELIsServerReachable(), 1);
  EXPECT_EQ(OpenDescriptors(), before);
}

TEST(IsServerReachableTest, GivesUpAtOnceOnAHostThatIsNotKnown) {
  WriteFile("/etc.defaults/arvoinfo.conf", "quendel_server=no.such.host\n");
  EXPECT_EQ(QUENDELIsServerReachable(), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged(
                         kUnit, "Failed to get IP address of target hostname: no.such.host")));
  EXPECT_EQ(Calls("socket"), 0);
  EXPECT_EQ(SleptSeconds(), 0);
}

TEST(IsServerReachableTest, GivesUpAtOnceOnAHostWithoutAnAddressOfItsKind) {
  char bytes[16] = {127, 0, 0, 1};
  char* addresses[] = {bytes, nullptr};
  char* none[] = {nullptr};
  hostent ofAnotherKind = {};
  ofAnotherKind.h_addrtype = AF_INET6;
  ofAnotherKind.h_addr_list = addresses;
  hostent withoutAny = {};
  withoutAny.h_addrtype = AF_INET;
  withoutAny.h_addr_list = none;
  for (hostent* host : {&ofAnotherKind, &withoutAny}) {
    ClearLog();
    On("gethostbyname").Nth(1).Return(host);
    EXPECT_EQ(QUENDELIsServerReachable(), 0);
    EXPECT_THAT(Log(), ElementsAre(Logged(
                           kUnit, "Failed to get IP address of target hostname: support.test")));
    EXPECT_EQ(Calls("socket"), 0);
  }
}

TEST(IsServerReachableTest, TriesOnlyTheFirstAddress) {
  WriteFile("/etc/hosts", "127.0.0.2 support.test\n127.0.0.1 support.test\n");
  WriteFile("/etc/host.conf", "multi on\n");
  AcceptPattern server("aaaaaa");  // listens on 127.0.0.1 only
  EXPECT_EQ(QUENDELIsServerReachable(), 0);
  EXPECT_THAT(Log(), SizeIs(6));
}
