// Many devices in one process: they send heartbeats, events and collections, each over a connection
// of its own with a handshake of its own, and write down what was acknowledged.
#include <arpa/inet.h>
#include <gnutls/crypto.h>
#include <gnutls/gnutls.h>
#include <netinet/tcp.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

struct Settings {
  uint16_t port = 51790;
  unsigned devices = 1000;
  unsigned threads = 4;
  unsigned stalled = 0;
  double seconds = 5;
  unsigned event_every = 10;        // requests
  unsigned collection_every = 100;  // likewise
  size_t collection_bytes = 1 << 20;
  std::string journal;
  bool echo = false;
};

std::atomic<bool> ending{false};

// One connection; every failure ends it.
class Connection {
 public:
  Connection(uint16_t port, gnutls_certificate_credentials_t credentials) {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const timeval limit = {20, 0};
    const int on = 1;
    setsockopt(socket_, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof(limit));
    setsockopt(socket_, IPPROTO_TCP, TCP_NODELAY, &on, sizeof(on));
    gnutls_init(&session_, GNUTLS_CLIENT);
    gnutls_set_default_priority(session_);
    gnutls_credentials_set(session_, GNUTLS_CRD_CERTIFICATE, credentials);
    gnutls_transport_set_int(session_, socket_);
    good_ = connect(socket_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
            Handshake();
  }
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;
  ~Connection() {
    gnutls_deinit(session_);
    close(socket_);
  }

  bool Send(std::string_view text) {
    while (good_ && !text.empty()) {
      const ssize_t sent = gnutls_record_send(session_, text.data(), text.size());
      good_ = sent > 0;
      text.remove_prefix(good_ ? static_cast<size_t>(sent) : 0);
    }
    return good_;
  }

  // Reads until the text has come. Returns whether it has.
  bool Await(const std::string& text) {
    std::string got;
    char block[4096];
    while (good_ && got.find(text) == std::string::npos) {
      const ssize_t size = gnutls_record_recv(session_, block, sizeof(block));
      good_ = size > 0;
      got.append(block, good_ ? static_cast<size_t>(size) : 0);
    }
    return good_;
  }

 private:
  bool Handshake() {
    int result = GNUTLS_E_AGAIN;
    while (result < 0 && gnutls_error_is_fatal(result) == 0) {
      result = gnutls_handshake(session_);
    }
    return result == GNUTLS_E_SUCCESS;
  }

  int socket_ = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  gnutls_session_t session_ = nullptr;
  bool good_ = false;
};

std::string Post(const std::string& path, const std::string& type, const std::string& body) {
  return "POST " + path +
         " HTTP/1.1\r\nHost: support.test\r\nConnection: close\r\nContent-Type: " + type +
         "\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

std::string Sha256(const std::string& bytes) {
  unsigned char digest[32];
  gnutls_hash_fast(GNUTLS_DIG_SHA256, bytes.data(), bytes.size(), digest);
  std::string text;
  for (const unsigned char byte : digest) {
    char digits[3];
    snprintf(digits, sizeof(digits), "%02x", byte);
    text += digits;
  }
  return text;
}

// The devices of one thread, by turns.
class Crew {
 public:
  Crew(const Settings& settings, unsigned number) : settings_(settings), number_(number) {
    gnutls_certificate_allocate_credentials(&credentials_);
  }
  Crew(const Crew&) = delete;
  Crew& operator=(const Crew&) = delete;
  ~Crew() { gnutls_certificate_free_credentials(credentials_); }

  void Work(Clock::time_point end) {
    for (unsigned turn = 1; !ending && Clock::now() < end; ++turn) {
      const unsigned device = number_ + turn * settings_.threads;
      Turn("D" + std::to_string(device % settings_.devices), turn);
    }
  }

  std::vector<double> waits;  // of the heartbeats that were answered, in seconds
  std::vector<std::string> journal;
  size_t answered = 0;
  size_t failed = 0;

 private:
  void Turn(const std::string& serial, unsigned turn) {
    if (settings_.collection_every > 0 && turn % settings_.collection_every == 0) {
      Collection(serial);
    } else if (settings_.event_every > 0 && turn % settings_.event_every == 0) {
      Event(serial, turn);
    } else {
      Heartbeat(serial);
    }
  }

  bool Exchange(const std::string& request, const std::string& reply) {
    Connection connection(settings_.port, credentials_);
    const bool good = connection.Send(request) && connection.Await(reply);
    ++(good ? answered : failed);
    return good;
  }

  void Heartbeat(const std::string& serial) {
    const std::string request = Post("/heartbeat/" + serial, "application/json", "null");
    const Clock::time_point begin = Clock::now();
    if (Exchange(request, settings_.echo ? "null" : "\"success\":true")) {
      waits.push_back(std::chrono::duration<double>(Clock::now() - begin).count());
    } else {
      std::this_thread::sleep_for(std::chrono::milliseconds(5));  // the server may be away
    }
  }

  void Event(const std::string& serial, unsigned turn) {
    const std::string mark = std::to_string(number_) + "-" + std::to_string(turn);
    const std::string body = R"({"action":"update_info","mark":")" + mark + "\"}";
    const std::string path = "/action/a/b/" + serial;
    Note("event", serial, mark, Exchange(Post(path, "application/json", body), "\"success\":true"));
  }

  void Collection(const std::string& serial) {
    std::string bytes(settings_.collection_bytes, '\0');
    gnutls_rnd(GNUTLS_RND_NONCE, bytes.data(), bytes.size());
    const std::string name = "Content-Disposition: form-data; name=\"file\"";
    const std::string body = "--bound\r\n" + name + "; filename=\"run\"\r\n\r\n" + bytes +
                             "\r\n--bound\r\n" + name +
                             "\r\n\r\n[{\"filename\":\"run\"}]\r\n--bound--\r\n";
    const std::string request =
        Post("/collect/a/b/" + serial, "multipart/form-data; boundary=bound", body);
    Note("collection", serial, Sha256(bytes), Exchange(request, "\"success\":true"));
  }

  void Note(const char* kind, const std::string& serial, const std::string& mark, bool good) {
    journal.push_back(std::string(kind) + " " + serial + " " + mark + (good ? " acked" : " cut"));
  }

  const Settings& settings_;
  const unsigned number_;
  gnutls_certificate_credentials_t credentials_ = nullptr;
};

// Connections that never say anything.
std::vector<int> Stall(const Settings& settings) {
  rlimit limit = {};
  getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(settings.port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  std::vector<int> connections;
  for (unsigned i = 0; i < settings.stalled; ++i) {
    connections.push_back(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (connect(connections.back(), reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
      perror("fleet: cannot stall a connection");
    }
  }
  return connections;
}

void Tell(const std::vector<std::unique_ptr<Crew>>& crews, double seconds) {
  std::vector<double> waits;
  size_t answered = 0;
  size_t failed = 0;
  for (const auto& crew : crews) {
    waits.insert(waits.end(), crew->waits.begin(), crew->waits.end());
    answered += crew->answered;
    failed += crew->failed;
  }
  std::sort(waits.begin(), waits.end());
  const auto percentile = [&waits](double part) {
    return waits.empty() ? 0 : 1000 * waits[static_cast<size_t>(part * double(waits.size() - 1))];
  };
  printf("%zu answered, %zu failed, %.0f/s; heartbeats: median %.1f ms, 99 %% %.1f ms\n", answered,
         failed, double(answered) / seconds, percentile(0.5), percentile(0.99));
}

void Run(const Settings& settings) {
  const std::vector<int> stalled = Stall(settings);
  const Clock::time_point begin = Clock::now();
  const auto end = begin + std::chrono::duration_cast<Clock::duration>(
                               std::chrono::duration<double>(settings.seconds));
  std::vector<std::unique_ptr<Crew>> crews;
  std::vector<std::thread> threads;
  for (unsigned i = 0; i < settings.threads; ++i) {
    crews.push_back(std::make_unique<Crew>(settings, i));
    threads.emplace_back([crew = crews.back().get(), end] { crew->Work(end); });
  }
  for (std::thread& thread : threads) {
    thread.join();
  }
  Tell(crews, std::chrono::duration<double>(Clock::now() - begin).count());
  std::ofstream journal(settings.journal.empty() ? "/dev/null" : settings.journal);
  for (const auto& crew : crews) {
    for (const std::string& line : crew->journal) {
      journal << line << "\n";
    }
  }
  for (const int connection : stalled) {
    close(connection);
  }
}

int Main(int argc, char** argv) {
  Settings settings;
  CLI::App app("Plays many devices against a server on this machine", "fleet");
  app.add_option("--port", settings.port, "The server's port")->capture_default_str();
  app.add_option("--devices", settings.devices, "How many devices")->capture_default_str();
  app.add_option("--threads", settings.threads, "How many at once")->capture_default_str();
  app.add_option("--seconds", settings.seconds, "How long")->capture_default_str();
  app.add_option("--stalled", settings.stalled, "Connections that say nothing meanwhile");
  app.add_option("--event-every", settings.event_every, "One request in so many; 0 for none")
      ->capture_default_str();
  app.add_option("--collection-every", settings.collection_every, "Likewise")
      ->capture_default_str();
  app.add_option("--collection-bytes", settings.collection_bytes, "Bytes of one")
      ->capture_default_str();
  app.add_option("--journal", settings.journal, "Where to note what was acknowledged");
  app.add_flag("--echo", settings.echo, "The server is a plain echo");
  CLI11_PARSE(app, argc, argv);
  signal(SIGPIPE, SIG_IGN);
  signal(SIGTERM, [](int) { ending = true; });
  Run(settings);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return Main(argc, argv);
  } catch (const std::exception& error) {
    fprintf(stderr, "fleet: %s\n", error.what());
  } catch (...) {
    fprintf(stderr, "fleet: it broke down\n");
  }
  return 1;
}
