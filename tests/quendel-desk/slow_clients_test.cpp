// Clients that are slow, stall or lie, and whoever has to be served beside them.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gnutls/gnutls.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>

#include <chrono>

#include "quendel-desk/running_desk.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/require.h"

using namespace quendel::test;

namespace {

using Clock = std::chrono::steady_clock;

double SecondsSince(Clock::time_point moment) {
  return std::chrono::duration<double>(Clock::now() - moment).count();
}

int Connect() {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(51790);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const int connection = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  Require(connect(connection, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0,
          "the desk does not listen");
  return connection;
}

// Waits until the other side has closed the connection.
bool IsClosedWithin(int connection, int milliseconds) {
  pollfd wait = {connection, POLLIN, 0};
  char byte = 0;
  return poll(&wait, 1, milliseconds) == 1 && recv(connection, &byte, 1, MSG_DONTWAIT) <= 0;
}

// A client that speaks TLS and sends what it is told to, when it is told to.
class SlowClient {
 public:
  SlowClient() : connection_(Connect()) {
    gnutls_certificate_allocate_credentials(&credentials_);
    gnutls_init(&session_, GNUTLS_CLIENT);
    gnutls_set_default_priority(session_);
    gnutls_credentials_set(session_, GNUTLS_CRD_CERTIFICATE, credentials_);
    gnutls_transport_set_int(session_, connection_);
    Require(gnutls_handshake(session_) == 0, "no handshake");
  }
  ~SlowClient() {
    gnutls_deinit(session_);
    gnutls_certificate_free_credentials(credentials_);
    close(connection_);
  }

  bool Send(std::string_view text) {
    while (!text.empty()) {
      const ssize_t sent = gnutls_record_send(session_, text.data(), text.size());
      if (sent <= 0) {
        return false;
      }
      text.remove_prefix(static_cast<size_t>(sent));
    }
    return true;
  }
  // Sends a byte now and then until the desk closes. Returns how long that took.
  double DripUntilClosed(const std::string& text, int everyMs) {
    const Clock::time_point begin = Clock::now();
    for (size_t i = 0; SecondsSince(begin) < 20; ++i) {
      if (!Send(text.substr(i % text.size(), 1)) || IsClosedWithin(connection_, everyMs)) {
        break;
      }
    }
    return SecondsSince(begin);
  }

 private:
  int connection_;
  gnutls_session_t session_ = nullptr;
  gnutls_certificate_credentials_t credentials_ = nullptr;
};

const std::string kCollectHead =
    "POST /collect/a1/b2/S1 HTTP/1.1\r\nHost: x\r\nContent-Length: 100000\r\n"
    "Content-Type: multipart/form-data; boundary=B\r\n\r\n";
const std::string kPart =
    "--B\r\nContent-Disposition: form-data; name=\"file\"; filename=\"a\"\r\n\r\n";

int Heartbeat() {
  Json::Value actions;
  return QUENDELHeartbeat(actions);
}

// Waits until so many connections are open, with the one that asks.
void AwaitConnections(int number) {
  const std::string line = "connections " + std::to_string(number) + "\n";
  for (int i = 0; i < 500; ++i) {
    if (AskWith({}, "GET", "/metrics").body.find(line) != std::string::npos) {
      return;
    }
    usleep(10'000);
  }
  ADD_FAILURE() << AskWith({}, "GET", "/metrics").body;
}

void ExpectNoFiles() {
  EXPECT_EQ(system("test -z \"$(find /volume1/desk/files -type f)\""), 0);
}

}  // namespace

TEST(DeskSlowClientsTest, AConnectionThatSendsNothingIsClosed) {
  const RunningDesk desk({"--head-seconds", "1"});
  const int connection = Connect();
  const Clock::time_point begin = Clock::now();
  EXPECT_TRUE(IsClosedWithin(connection, 5000));
  EXPECT_GT(SecondsSince(begin), 0.9);
  close(connection);
}

TEST(DeskSlowClientsTest, AHeadThatDripsIsCut) {
  const RunningDesk desk({"--head-seconds", "1"});
  const double seconds = SlowClient().DripUntilClosed("POST /heartbeat/S1 HTTP/1.1\r\nX: ", 50);
  EXPECT_GT(seconds, 0.8);
  EXPECT_LT(seconds, 5);
}

TEST(DeskSlowClientsTest, ABodyThatDripsIsCutAndLeavesALineOnly) {
  const RunningDesk desk({"--pause-seconds", "1"});
  SlowClient client;
  ASSERT_TRUE(client.Send(kCollectHead + kPart));
  EXPECT_LT(client.DripUntilClosed("x", 50), 5);
  EXPECT_TRUE(desk.Logs("\"POST /collect/a1/b2/S1\" cut"));
  ExpectNoFiles();
  EXPECT_EQ(DeviceNumber(), 0);
}

TEST(DeskSlowClientsTest, ABodyThatIsCutLeavesALineOnly) {
  const RunningDesk desk;
  {
    SlowClient client;
    ASSERT_TRUE(client.Send(kCollectHead + kPart + std::string(50'000, 'x')));
    usleep(50'000);
  }
  EXPECT_TRUE(desk.Logs("\"POST /collect/a1/b2/S1\" cut"));
  ExpectNoFiles();
}

TEST(DeskSlowClientsTest, AFormWithoutAnEndIsRefused) {
  const RunningDesk desk;
  SlowClient client;
  ASSERT_TRUE(client.Send(kCollectHead + kPart + std::string(100'000 - kPart.size(), 'x')));
  EXPECT_TRUE(desk.Logs("the form has no end"));
  ExpectNoFiles();
}

TEST(DeskSlowClientsTest, AnAddressHasOnlySoManyConnections) {
  const RunningDesk desk({"--max-connections-per-address", "20"});
  AwaitConnections(1);
  std::vector<int> connections;
  for (int i = 0; i < 20; ++i) {
    connections.push_back(Connect());
  }
  EXPECT_EQ(Heartbeat(), -1);
  close(connections.back());
  AwaitConnections(20);
  EXPECT_EQ(Heartbeat(), 0);
  EXPECT_FALSE(IsClosedWithin(connections[0], 0));
}

TEST(DeskSlowClientsTest, WhenThereAreTooManyTheLongestStalledMakesRoom) {
  const RunningDesk desk({"--max-connections", "50"});
  std::vector<int> connections;
  for (int i = 0; i < 50; ++i) {
    connections.push_back(Connect());
  }
  EXPECT_EQ(Heartbeat(), 0);
  EXPECT_TRUE(IsClosedWithin(connections[0], 1000));
  EXPECT_FALSE(IsClosedWithin(connections[40], 0));
}

TEST(DeskSlowClientsTest, AThousandStalledConnectionsKeepNobodyFromBeingServed) {
  const RunningDesk desk({"--max-connections-per-address", "2000"});
  rlimit limit = {4096, 4096};
  setrlimit(RLIMIT_NOFILE, &limit);
  std::vector<int> connections;
  for (int i = 0; i < 1000; ++i) {
    connections.push_back(Connect());
  }
  for (int i = 0; i < 50; ++i) {
    EXPECT_EQ(Heartbeat(), 0);
  }
  AwaitConnections(1001);
}
