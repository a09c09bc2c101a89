// The scripted HTTPS server: a program of its own, so that a test's forks, signals and crashes do
// not reach it. It speaks TLS and HTTP by hand, because its business is to break their rules
// exactly.
#include <arpa/inet.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <signal.h>
#include <strings.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <mutex>
#include <sstream>
#include <string_view>
#include <thread>

#include "support/answer_file.h"

namespace quendel::test {
namespace {

namespace fs = std::filesystem;

constexpr char kUsage[] = R"(Usage: test_server [OPTION...]

An HTTPS server that answers what it is told to and keeps every request. It runs until it is killed.

  --port PORT         the port to listen on (default 51790)
  --host NAME         the name in its certificate (default support.test)
  --cert KIND         the certificate: self-signed (default), expired or wrong-host
  --dir DIR           where answers and requests are (default /run/test-server)
  --help              show this text

In DIR:
  answers/NAME        an answer for one request; the first by name is used and removed. Rename files
                      into this folder, so that none is seen half written.
  default             the answer when there is none in answers/; without it that is the status 200
                      with the body {"success":true}
  certificate         a KIND that overrides --cert, read at each connection
  requests/NNNNNNNN.http
                      the bytes of a request, there before it is answered; .broken when it did not
                      arrive whole, .part while it arrives

An answer is any of these lines, an empty line, and the body as it is to be sent:
  status N            header NAME: VALUE  chunked 1
  delay_ms N          wait before the first byte
  slow_byte_ms N      wait after each byte
  content_length N    claim this length
  cut_after N         close the connection, without a farewell, after N bytes of the whole answer
  fill N              send N times the letter x behind the body
  tail N              send the last N bytes of the body behind the fill
)";

struct Settings {
  uint16_t port = 51790;
  std::string host = "support.test";
  std::string certificate = "self-signed";
  fs::path folder = kServerFolder;
};

[[noreturn]] void Fail(const std::string& message) {
  fprintf(stderr, "test_server: %s\n", message.c_str());
  exit(1);
}

void Pause(int milliseconds) {
  std::this_thread::sleep_for(std::chrono::milliseconds(milliseconds));
}

bool ReadWhole(const fs::path& path, std::string& text) {
  const std::ifstream file(path, std::ios::binary);
  std::ostringstream read;
  read << file.rdbuf();
  text = read.str();
  return file.is_open();
}

// ---- Certificates

template <auto Free>
struct Freer {
  template <typename Object>
  void operator()(Object* object) const {
    Free(object);
  }
};
using Key = std::unique_ptr<EVP_PKEY, Freer<EVP_PKEY_free>>;
using Certificate = std::unique_ptr<X509, Freer<X509_free>>;
using Context = std::unique_ptr<SSL_CTX, Freer<SSL_CTX_free>>;
using Session = std::unique_ptr<SSL, Freer<SSL_free>>;

constexpr long kDay = 24L * 60 * 60;

Certificate MakeCertificate(EVP_PKEY* key, const std::string& kind, const std::string& host) {
  const std::string name = kind == "wrong-host" ? "elsewhere.test" : host;
  Certificate certificate(X509_new());
  X509* x509 = certificate.get();
  X509_set_version(x509, X509_VERSION_3);
  ASN1_INTEGER_set(X509_get_serialNumber(x509), 1);
  X509_gmtime_adj(X509_getm_notBefore(x509), -30 * kDay);
  X509_gmtime_adj(X509_getm_notAfter(x509), kind == "expired" ? -kDay : 30 * kDay);
  X509_set_pubkey(x509, key);

  X509_NAME* subject = X509_get_subject_name(x509);
  X509_NAME_add_entry_by_txt(subject, "CN", MBSTRING_UTF8,
                             reinterpret_cast<const unsigned char*>(name.c_str()), -1, -1, 0);
  X509_set_issuer_name(x509, subject);
  X509_EXTENSION* names =
      X509V3_EXT_conf_nid(nullptr, nullptr, NID_subject_alt_name, ("DNS:" + name).c_str());
  X509_add_ext(x509, names, -1);
  X509_EXTENSION_free(names);
  X509_sign(x509, key, EVP_sha256());
  return certificate;
}

// ---- Requests

// Follows the framing of a request's bytes, to find its end and nothing else.
class RequestReader {
 public:
  // Takes the next bytes. Returns how many of them belong to the request.
  size_t Take(const char* bytes, size_t size) {
    size_t used = 0;
    while (used < size && state_ != kDone) {
      used += state_ == kBytes ? TakeBytes(size - used) : TakeText(bytes[used]);
    }
    return used;
  }

  bool done() const { return state_ == kDone; }
  bool head_done() const { return state_ != kHead; }
  bool expects_continue() const { return expects_continue_; }
  const std::string& line() const { return line_; }

 private:
  enum State { kHead, kBytes, kChunkSize, kTrailer, kDone };

  size_t TakeBytes(size_t size) {
    const size_t taken = std::min(size, left_);
    left_ -= taken;
    if (left_ == 0) {
      state_ = chunked_ ? kChunkSize : kDone;
    }
    return taken;
  }

  // Everything but body bytes comes in lines.
  size_t TakeText(char byte) {
    if (byte != '\n') {
      text_ += byte;
      return 1;
    }
    if (!text_.empty() && text_.back() == '\r') {
      text_.pop_back();
    }
    const std::string text = std::move(text_);
    text_.clear();
    TakeLine(text);
    return 1;
  }

  void TakeLine(const std::string& text) {
    if (state_ == kHead) {
      TakeHeadLine(text);
    } else if (state_ == kChunkSize) {
      left_ = strtoul(text.c_str(), nullptr, 16);
      state_ = left_ == 0 ? kTrailer : kBytes;
      left_ += left_ == 0 ? 0 : strlen("\r\n");
    } else if (text.empty()) {
      state_ = kDone;
    }
  }

  void TakeHeadLine(const std::string& text) {
    if (line_.empty()) {
      line_ = text;
    } else if (text.empty()) {
      state_ = chunked_ ? kChunkSize : left_ > 0 ? kBytes : kDone;
    } else if (strncasecmp(text.c_str(), "Content-Length:", 15) == 0) {
      left_ = strtoul(text.c_str() + 15, nullptr, 10);
    } else if (strcasecmp(text.c_str(), "Transfer-Encoding: chunked") == 0) {
      chunked_ = true;
    } else if (strcasecmp(text.c_str(), "Expect: 100-continue") == 0) {
      expects_continue_ = true;
    }
  }

  State state_ = kHead;
  std::string text_;
  std::string line_;
  size_t left_ = 0;
  bool chunked_ = false;
  bool expects_continue_ = false;
};

// ---- Answers

// Sends an answer, as slowly and as incompletely as it says.
class AnswerWriter {
 public:
  AnswerWriter(SSL* session, const ScriptedAnswer& answer) : session_(session), answer_(answer) {}

  // Returns whether the whole answer went out.
  bool Write() {
    Pause(answer_.delay_ms);
    return Send(Head()) && SendBody();
  }

 private:
  std::string Head() const {
    std::ostringstream head;
    head << "HTTP/1.1 " << answer_.status << " Scripted\r\n";
    if (answer_.chunked) {
      head << "Transfer-Encoding: chunked\r\n";
    } else {
      const size_t size = answer_.body.size() + answer_.fill + answer_.tail.size();
      head << "Content-Length: "
           << (answer_.content_length < 0 ? std::to_string(size)
                                          : std::to_string(answer_.content_length))
           << "\r\n";
    }
    head << "Connection: close\r\n";
    for (const auto& [name, value] : answer_.headers) {
      head << name << ": " << value << "\r\n";
    }
    head << "\r\n";
    return head.str();
  }

  bool SendBody() {
    if (!SendPiece(answer_.body)) {
      return false;
    }
    const std::string block(std::min<size_t>(answer_.fill, 64 * 1024), 'x');
    for (size_t left = answer_.fill; left > 0;) {
      const size_t size = std::min(left, block.size());
      if (!SendPiece({block.data(), size})) {
        return false;
      }
      left -= size;
    }
    return SendPiece(answer_.tail) && (!answer_.chunked || Send("0\r\n\r\n"));
  }

  bool SendPiece(std::string_view piece) {
    if (!answer_.chunked || piece.empty()) {
      return Send(piece);
    }
    char size[32];
    snprintf(size, sizeof size, "%zx\r\n", piece.size());
    return Send(size) && Send(piece) && Send("\r\n");
  }

  bool Send(std::string_view bytes) {
    const size_t most = answer_.cut_after < 0 ? SIZE_MAX : static_cast<size_t>(answer_.cut_after);
    const bool cut = bytes.size() > most - sent_;
    bytes = bytes.substr(0, most - sent_);
    sent_ += bytes.size();
    const size_t step = answer_.slow_byte_ms > 0 ? 1 : bytes.size();
    for (; !bytes.empty(); bytes.remove_prefix(step)) {
      if (SSL_write(session_, bytes.data(), static_cast<int>(step)) <= 0) {
        return false;
      }
      Pause(answer_.slow_byte_ms);
    }
    return !cut;
  }

  SSL* session_;
  const ScriptedAnswer& answer_;
  size_t sent_ = 0;
};

// ---- The server

class Server {
 public:
  explicit Server(const Settings& settings) : settings_(settings), key_(EVP_EC_gen("P-256")) {
    fs::create_directories(settings_.folder / "answers");
    fs::create_directories(settings_.folder / "requests");
  }

  [[noreturn]] void Run() {
    const int listener = Listen();
    for (;;) {
      const int connection = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
      if (connection >= 0) {
        std::thread(&Server::Serve, this, connection, ++connections_).detach();
      }
    }
  }

 private:
  // Both protocols where there are both.
  int Listen() const {
    sockaddr_in6 address = {};
    address.sin6_family = AF_INET6;
    address.sin6_port = htons(settings_.port);
    sockaddr_in old = {};
    old.sin_family = AF_INET;
    old.sin_port = htons(settings_.port);

    int listener = socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const bool both = listener >= 0;
    if (!both) {
      listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    }
    const int on = 1;
    const int off = 0;
    setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    setsockopt(listener, IPPROTO_IPV6, IPV6_V6ONLY, &off, sizeof off);
    if (bind(listener,
             both ? reinterpret_cast<sockaddr*>(&address) : reinterpret_cast<sockaddr*>(&old),
             both ? sizeof address : sizeof old) != 0 ||
        listen(listener, SOMAXCONN) != 0) {
      Fail("cannot listen on port " + std::to_string(settings_.port) + ": " + strerror(errno));
    }
    return listener;
  }

  void Serve(int connection, int number) {
    const Context context = MakeContext();
    const Session session(SSL_new(context.get()));
    SSL_set_fd(session.get(), connection);
    ScriptedAnswer answer;
    if (SSL_accept(session.get()) == 1 && Receive(session.get(), number)) {
      answer = NextAnswer();
      if (AnswerWriter(session.get(), answer).Write()) {
        SSL_shutdown(session.get());
      }
    }
    close(connection);
  }

  Context MakeContext() const {
    std::string kind;
    if (!ReadWhole(settings_.folder / "certificate", kind)) {
      kind = settings_.certificate;
    }
    Context context(SSL_CTX_new(TLS_server_method()));
    const Certificate certificate = MakeCertificate(key_.get(), kind, settings_.host);
    SSL_CTX_use_certificate(context.get(), certificate.get());
    SSL_CTX_use_PrivateKey(context.get(), key_.get());
    return context;
  }

  // Keeps the request's bytes as they come. Returns whether the request is whole.
  bool Receive(SSL* session, int number) const {
    char name[16];
    snprintf(name, sizeof name, "%08d", number);
    const fs::path stem = settings_.folder / "requests" / name;
    const fs::path part = stem.string() + ".part";
    std::ofstream file(part, std::ios::binary);
    RequestReader request;
    bool continued = false;
    char bytes[64 * 1024];
    while (!request.done()) {
      const int size = SSL_read(session, bytes, sizeof bytes);
      if (size <= 0) {
        break;
      }
      const size_t used = request.Take(bytes, static_cast<size_t>(size));
      file.write(bytes, static_cast<std::streamsize>(used));
      if (request.head_done() && request.expects_continue() && !continued) {
        continued = true;
        SSL_write(session, "HTTP/1.1 100 Continue\r\n\r\n", 25);
      }
    }
    file.close();
    fs::rename(part, stem.string() + (request.done() ? ".http" : ".broken"));
    printf("%s%s\n", request.line().c_str(), request.done() ? "" : " (broken off)");
    fflush(stdout);
    return request.done();
  }

  ScriptedAnswer NextAnswer() {
    const std::lock_guard<std::mutex> lock(answers_);
    fs::path first;
    for (const fs::directory_entry& entry : fs::directory_iterator(settings_.folder / "answers")) {
      if (first.empty() || entry.path() < first) {
        first = entry.path();
      }
    }
    std::string text;
    ScriptedAnswer answer;
    if (first.empty() && !ReadWhole(settings_.folder / "default", text)) {
      answer.body = R"({"success":true})";
      return answer;
    }
    if (!first.empty()) {
      ReadWhole(first, text);
      fs::remove(first);
    }
    if (!AnswerFromText(text, answer)) {
      Fail("not an answer: " + first.string());
    }
    return answer;
  }

  const Settings settings_;
  const Key key_;
  std::mutex answers_;
  int connections_ = 0;
};

uint16_t PortFrom(const std::string& text) {
  char* end = nullptr;
  const unsigned long port = strtoul(text.c_str(), &end, 10);
  if (port < 1 || port > UINT16_MAX || *end != '\0') {
    Fail("no port: " + text);
  }
  return static_cast<uint16_t>(port);
}

Settings SettingsFrom(int argc, char** argv) {
  Settings settings;
  for (int i = 1; i < argc; i += 2) {
    const std::string option = argv[i];
    if (option == "--help") {
      fputs(kUsage, stdout);
      exit(0);
    }
    if (i + 1 == argc) {
      Fail(option + " needs a value (--help lists the options)");
    }
    const std::string value = argv[i + 1];
    if (option == "--port") {
      settings.port = PortFrom(value);
    } else if (option == "--host") {
      settings.host = value;
    } else if (option == "--cert") {
      settings.certificate = value;
      if (value != "self-signed" && value != "expired" && value != "wrong-host") {
        Fail("no certificate of the kind " + value);
      }
    } else if (option == "--dir") {
      settings.folder = value;
    } else {
      Fail("unknown option " + option + " (--help lists the options)");
    }
  }
  return settings;
}

}  // namespace
}  // namespace quendel::test

int main(int argc, char** argv) {
  using namespace quendel::test;
  signal(SIGPIPE, SIG_IGN);
  Server(SettingsFrom(argc, argv)).Run();
}
