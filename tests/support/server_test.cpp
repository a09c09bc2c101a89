// The scripted HTTPS server, seen by a client that counts every byte.
#include "support/server.h"

#include <arpa/inet.h>
#include <dirent.h>
#include <gmock/gmock.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <thread>

#include "support/appliance.h"
#include "support/require.h"

using namespace quendel::test;
using testing::AllOf;
using testing::ElementsAre;
using testing::Ge;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Le;
using testing::Pair;
using testing::SizeIs;
using testing::StartsWith;

namespace {

constexpr char kPost[] = "POST /a HTTP/1.1\r\nHost: x\r\nContent-Length: 4\r\n\r\nbody";

constexpr char kUsualAnswer[] =
    "HTTP/1.1 200 Scripted\r\nContent-Length: 16\r\nConnection: close\r\n\r\n{\"success\":true}";

// One connection.
class Client {
 public:
  explicit Client(int family = AF_INET)
      : context_(SSL_CTX_new(TLS_client_method()), SSL_CTX_free),
        session_(SSL_new(context_.get()), SSL_free),
        fd_(socket(family, SOCK_STREAM, 0)) {
    sockaddr_in old = {};
    old.sin_family = AF_INET;
    old.sin_port = htons(51790);
    old.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    sockaddr_in6 address = {};
    address.sin6_family = AF_INET6;
    address.sin6_port = htons(51790);
    address.sin6_addr = in6addr_loopback;
    const int result = family == AF_INET
                           ? connect(fd_, reinterpret_cast<sockaddr*>(&old), sizeof old)
                           : connect(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address);
    Require(result == 0, "cannot connect to the server");
    // Later versions of TLS send more than was asked for, which Silent() would take for an answer.
    SSL_set_max_proto_version(session_.get(), TLS1_2_VERSION);
    SSL_set_fd(session_.get(), fd_);
    Require(SSL_connect(session_.get()) == 1, "no TLS with the server");
  }
  ~Client() { close(fd_); }
  Client(const Client&) = delete;
  Client& operator=(const Client&) = delete;

  void Send(const std::string& bytes) {
    Require(SSL_write(session_.get(), bytes.data(), static_cast<int>(bytes.size())) > 0,
            "cannot send to the server");
  }

  // Returns what comes until the server closes, or until `most` bytes are there.
  std::string Receive(size_t most = SIZE_MAX) {
    std::string received;
    char bytes[16384];
    int size = 1;
    while (received.size() < most && (size = SSL_read(session_.get(), bytes, sizeof bytes)) > 0) {
      received.append(bytes, static_cast<size_t>(size));
    }
    if (size <= 0) {
      farewell_ = SSL_get_error(session_.get(), size) == SSL_ERROR_ZERO_RETURN;
    }
    return received;
  }

  // Receives and counts, but keeps nothing.
  size_t Drain() {
    size_t received = 0;
    char bytes[16384];
    for (int size; (size = SSL_read(session_.get(), bytes, sizeof bytes)) > 0;) {
      received += static_cast<size_t>(size);
    }
    return received;
  }

  // Whether the server ended the connection as TLS asks for.
  bool farewell() const { return farewell_; }

  bool Silent(int milliseconds) const {
    pollfd readable = {fd_, POLLIN, 0};
    return SSL_pending(session_.get()) == 0 && poll(&readable, 1, milliseconds) == 0;
  }

  X509* certificate() const { return SSL_get0_peer_certificate(session_.get()); }

 private:
  std::unique_ptr<SSL_CTX, void (*)(SSL_CTX*)> context_;
  std::unique_ptr<SSL, void (*)(SSL*)> session_;
  int fd_;
  bool farewell_ = false;
};

std::string Exchange(const std::string& request = kPost) {
  Client client;
  client.Send(request);
  return client.Receive();
}

int MillisecondsOf(const std::function<void()>& action) {
  const auto start = std::chrono::steady_clock::now();
  action();
  return static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(
                              std::chrono::steady_clock::now() - start)
                              .count());
}

// The most memory that the server has used, in KiB.
long ServerPeakMemory() {
  for (const auto& process : std::filesystem::directory_iterator("/proc")) {
    std::ifstream status(process.path() / "status");
    std::string word;
    long peak = 0;
    bool server = false;
    while (status >> word) {
      server = server || word == "test_server";
      if (word == "VmHWM:") {
        status >> peak;
      }
    }
    if (server) {
      return peak;
    }
  }
  Require(false, "no server process");
  return 0;
}

std::string BodyOf(const std::string& answer) {
  return answer.substr(answer.find("\r\n\r\n") + 4);
}

// Waits for a file that the server is about to write.
void WaitFor(const std::string& path) {
  for (int i = 0; i < 500 && !Exists(path); ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  EXPECT_TRUE(Exists(path)) << path;
}

}  // namespace

TEST(AnswerTest, IsSuccessWhenNoneIsQueued) {
  EXPECT_EQ(Exchange(), kUsualAnswer);
}

TEST(AnswerTest, IsGivenOnceInTheOrderOfTheQueue) {
  Answer({.body = "one"});
  Answer({.body = "two"});
  EXPECT_EQ(BodyOf(Exchange()), "one");
  EXPECT_EQ(BodyOf(Exchange()), "two");
  EXPECT_EQ(Exchange(), kUsualAnswer);
}

TEST(AnswerTest, HasItsStatusHeadersAndBody) {
  Answer({.status = 503,
          .body = std::string("\0\n\n\xff", 4),
          .headers = {{"Retry-After", "7"}, {"X-Empty", ""}}});
  EXPECT_EQ(Exchange(), std::string("HTTP/1.1 503 Scripted\r\nContent-Length: 4\r\n"
                                    "Connection: close\r\nRetry-After: 7\r\nX-Empty: \r\n\r\n") +
                            std::string("\0\n\n\xff", 4));
}

TEST(AnswerTest, CanBeEmpty) {
  Answer({.status = 204});
  EXPECT_EQ(Exchange(), "HTTP/1.1 204 Scripted\r\nContent-Length: 0\r\nConnection: close\r\n\r\n");
}

TEST(AnswerTest, EndsTheConnectionProperly) {
  Client client;
  client.Send(kPost);
  client.Receive();
  EXPECT_TRUE(client.farewell());
}

TEST(AnswerTest, CanBeCutAtAnyByte) {
  const std::string whole = kUsualAnswer;
  for (size_t size = 0; size <= whole.size(); ++size) {
    Answer({.body = "{\"success\":true}", .cut_after = static_cast<long>(size)});
    Client client;
    client.Send(kPost);
    EXPECT_EQ(client.Receive(), whole.substr(0, size));
    EXPECT_EQ(client.farewell(), size == whole.size()) << size;
  }
}

TEST(AnswerTest, CanBeDelayed) {
  Answer({.delay_ms = 150});
  EXPECT_THAT(MillisecondsOf([] { Exchange(); }), Ge(150));
}

TEST(AnswerTest, CanComeByteByByte) {
  Answer({.body = std::string(40, 'b'), .slow_byte_ms = 2});
  std::string answer;
  EXPECT_THAT(MillisecondsOf([&answer] { answer = Exchange(); }), Ge(2 * 40));
  EXPECT_EQ(BodyOf(answer), std::string(40, 'b'));
}

TEST(AnswerTest, CanClaimAnotherLength) {
  Answer({.body = "text", .content_length = 1000});
  EXPECT_THAT(Exchange(),
              AllOf(HasSubstr("\r\nContent-Length: 1000\r\n"), testing::EndsWith("\r\n\r\ntext")));
  Answer({.body = "text", .content_length = 0});
  EXPECT_THAT(Exchange(),
              AllOf(HasSubstr("\r\nContent-Length: 0\r\n"), testing::EndsWith("\r\n\r\ntext")));
}

TEST(AnswerTest, CanComeInChunks) {
  Answer({.body = "0123456789abcdef", .chunked = true, .fill = 3, .tail = "end"});
  EXPECT_EQ(Exchange(),
            "HTTP/1.1 200 Scripted\r\nTransfer-Encoding: chunked\r\nConnection: close\r\n\r\n"
            "10\r\n0123456789abcdef\r\n3\r\nxxx\r\n3\r\nend\r\n0\r\n\r\n");
}

TEST(AnswerTest, CanBeFilledUp) {
  Answer({.body = "[", .fill = 5, .tail = "]"});
  EXPECT_EQ(Exchange(),
            "HTTP/1.1 200 Scripted\r\nContent-Length: 7\r\nConnection: close\r\n\r\n"
            "[xxxxx]");
}

TEST(AnswerTest, IsHugeAtNoCostInMemory) {
  constexpr size_t kSize = 300'000'000;
  Exchange();
  const long before = ServerPeakMemory();
  Answer({.fill = kSize});
  Client client;
  client.Send(kPost);
  EXPECT_THAT(client.Drain(), Ge(kSize));
  EXPECT_THAT(ServerPeakMemory() - before, Le(20'000));
}

TEST(RequestsTest, AreEmptyAtTheStart) {
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST(RequestsTest, HoldEveryByte) {
  const std::string request =
      "PUT /a%20b?c HTTP/1.0\r\nHost: x\r\nb: 2\r\nA:1\r\nA:  two words \r\n"
      "Content-Length: 6\r\n\r\n\r\n\r\n\0\xff" +
      std::string();
  const std::string raw =
      request.substr(0, request.find("\r\n\r\n") + 4) + std::string("\r\n\r\0\xff!", 6);
  Exchange(raw);
  ASSERT_THAT(Requests(), SizeIs(1));
  const Request received = Requests()[0];
  EXPECT_EQ(received.raw, raw);
  EXPECT_EQ(received.line, "PUT /a%20b?c HTTP/1.0");
  EXPECT_THAT(received.headers, ElementsAre(Pair("Host", "x"), Pair("b", "2"), Pair("A", "1"),
                                            Pair("A", "two words "), Pair("Content-Length", "6")));
  EXPECT_EQ(received.body, std::string("\r\n\r\0\xff!", 6));
}

TEST(RequestsTest, AreThereBeforeTheAnswer) {
  Answer({.delay_ms = 100000});
  Client client;
  client.Send(kPost);
  WaitFor("/run/test-server/requests/00000001.http");
  EXPECT_THAT(Requests(), SizeIs(1));
}

TEST(RequestsTest, MayHaveNoBody) {
  Exchange("GET / HTTP/1.1\r\n\r\n");
  EXPECT_EQ(Requests().at(0).line, "GET / HTTP/1.1");
  EXPECT_EQ(Requests().at(0).body, "");
}

TEST(RequestsTest, MayComeInPieces) {
  Client client;
  for (const char byte : std::string(kPost)) {
    client.Send(std::string(1, byte));
  }
  EXPECT_EQ(client.Receive(), kUsualAnswer);
  EXPECT_EQ(Requests().at(0).raw, kPost);
}

TEST(RequestsTest, MayComeInChunks) {
  const std::string raw =
      "POST / HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\n"
      "5;extension\r\n01234\r\nA\r\n5678\r\n9abc\r\n0\r\nTrailer: x\r\n\r\n";
  EXPECT_EQ(Exchange(raw), kUsualAnswer);
  EXPECT_EQ(Requests().at(0).raw, raw);
  EXPECT_EQ(Requests().at(0).body, "012345678\r\n9abc");
}

TEST(RequestsTest, AreAskedForWhenTheClientWaits) {
  Client client;
  client.Send("POST / HTTP/1.1\r\nExpect: 100-continue\r\nContent-Length: 4\r\n\r\n");
  EXPECT_EQ(client.Receive(1), "HTTP/1.1 100 Continue\r\n\r\n");
  client.Send("body");
  EXPECT_EQ(client.Receive(), kUsualAnswer);
  EXPECT_EQ(Requests().at(0).body, "body");
}

TEST(RequestsTest, AreNotAskedForWhenTheyAreThere) {
  EXPECT_THAT(Exchange(kPost), StartsWith("HTTP/1.1 200 "));
}

TEST(RequestsTest, AreNotAnsweredBeforeTheyAreWhole) {
  Client client;
  client.Send(std::string(kPost).substr(0, strlen(kPost) - 1));
  EXPECT_TRUE(client.Silent(100));
  client.Send("y");
  EXPECT_EQ(client.Receive(), kUsualAnswer);
}

TEST(RequestsTest, LeaveOutWhatWasBrokenOff) {
  { Client(AF_INET).Send("POST / HTTP/1.1\r\nContent-Length: 9\r\n\r\nbo"); }
  WaitFor("/run/test-server/requests/00000001.broken");
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(ReadFile("/run/test-server/requests/00000001.broken"),
            "POST / HTTP/1.1\r\nContent-Length: 9\r\n\r\nbo");
}

TEST(RequestsTest, AreInTheOrderOfTheirConnections) {
  Client first;
  first.Send("POST /first HTTP/1.1\r\n");
  Exchange("POST /second HTTP/1.1\r\n\r\n");
  first.Send("\r\n");
  first.Receive();
  ASSERT_THAT(Requests(), SizeIs(2));
  EXPECT_EQ(Requests()[0].line, "POST /first HTTP/1.1");
  EXPECT_EQ(Requests()[1].line, "POST /second HTTP/1.1");
}

TEST(RequestsTest, AreHugeAtNoCostInMemory) {
  constexpr size_t kBlock = 1'000'000;
  constexpr size_t kBlocks = 100;
  Exchange();
  const long before = ServerPeakMemory();
  Client client;
  client.Send("POST /huge HTTP/1.1\r\nContent-Length: " + std::to_string(kBlocks * kBlock) +
              "\r\n\r\n");
  for (size_t i = 0; i < kBlocks; ++i) {
    client.Send(std::string(kBlock, 'b'));
  }
  EXPECT_EQ(client.Receive(), kUsualAnswer);
  ASSERT_THAT(RequestFiles(), SizeIs(2));
  EXPECT_THAT(std::filesystem::file_size(RequestFiles()[1]), Ge(kBlocks * kBlock));
  EXPECT_THAT(ServerPeakMemory() - before, Le(20'000));
}

TEST(ServerTest, ListensOnBothProtocols) {
  Client client(AF_INET6);
  client.Send(kPost);
  EXPECT_EQ(client.Receive(), kUsualAnswer);
}

TEST(ServerTest, SurvivesAClientThatDoesNotSpeakTls) {
  const int fd = socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in server = {};
  server.sin_family = AF_INET;
  server.sin_port = htons(51790);
  server.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&server), sizeof server), 0);
  ASSERT_GT(write(fd, kPost, strlen(kPost)), 0);
  close(fd);
  EXPECT_EQ(Exchange(), kUsualAnswer);
}

TEST(ServerTest, GivesTheFolderSomeDefault) {
  WriteFile("/run/test-server/default", "status 418\n\nteapot");
  EXPECT_THAT(Exchange(), AllOf(StartsWith("HTTP/1.1 418 "), testing::EndsWith("\r\n\r\nteapot")));
  Answer({.body = "queued"});
  EXPECT_EQ(BodyOf(Exchange()), "queued");
  EXPECT_EQ(BodyOf(Exchange()), "teapot");
}

TEST(UseCertificateTest, StartsWithAValidOneForTheHost) {
  const Client client;
  EXPECT_EQ(X509_check_host(client.certificate(), "support.test", 0, 0, nullptr), 1);
  EXPECT_EQ(X509_cmp_current_time(X509_get0_notBefore(client.certificate())), -1);
  EXPECT_EQ(X509_cmp_current_time(X509_get0_notAfter(client.certificate())), 1);
  EXPECT_EQ(X509_check_issued(client.certificate(), client.certificate()), X509_V_OK);
}

TEST(UseCertificateTest, ShowsAnExpiredOne) {
  UseCertificate("expired");
  const Client client;
  EXPECT_EQ(X509_check_host(client.certificate(), "support.test", 0, 0, nullptr), 1);
  EXPECT_EQ(X509_cmp_current_time(X509_get0_notAfter(client.certificate())), -1);
}

TEST(UseCertificateTest, ShowsOneForAnotherHost) {
  UseCertificate("wrong-host");
  const Client client;
  EXPECT_EQ(X509_check_host(client.certificate(), "support.test", 0, 0, nullptr), 0);
  EXPECT_EQ(X509_cmp_current_time(X509_get0_notAfter(client.certificate())), 1);
}

TEST(UseCertificateTest, GoesBackToTheFirst) {
  UseCertificate("expired");
  UseCertificate("self-signed");
  const Client client;
  EXPECT_EQ(X509_cmp_current_time(X509_get0_notAfter(client.certificate())), 1);
}

TEST(UseCertificateDeathTest, KnowsItsKinds) {
  EXPECT_DEATH(UseCertificate("self-singed"), "no certificate of the kind self-singed");
}
