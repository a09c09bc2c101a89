#include "control.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include "json.h"

namespace quendeld {
namespace {

constexpr size_t kMostConnections = 16;
constexpr size_t kMostRequestBytes = 4096;
constexpr int kSendBufferBytes = 1 << 20;  // an answer goes out in one piece

int Listen(const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  unlink(path.c_str());
  const int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  const mode_t before = umask(0177);  // nobody else's from its first moment
  const bool listens =
      listener >= 0 &&
      bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
      listen(listener, static_cast<int>(kMostConnections)) == 0;
  const int reason = errno;
  umask(before);
  if (!listens) {
    if (listener >= 0) {
      close(listener);
    }
    throw std::system_error(reason, std::generic_category(), "cannot listen at " + path);
  }
  return listener;
}

Json::Value Refusal(const char* reason) {
  Json::Value answer = Json::objectValue;
  answer["success"] = false;
  answer["reason"] = reason;
  return answer;
}

}  // namespace

Control::Connection::~Connection() {
  readable.reset();
  close(socket);
}

Control::Control(Loop& loop, const std::string& path, Handler handler)
    : loop_(loop), path_(path), handler_(std::move(handler)), listener_(Listen(path)) {
  readable_ = std::make_unique<Readable>(loop_, listener_, [this] { Accept(); });
}

Control::~Control() {
  connections_.clear();
  readable_.reset();
  close(listener_);
  unlink(path_.c_str());
}

// The oldest one that has not asked yet makes room for a new one; one that waits for its answer is
// not disturbed.
void Control::Accept() {
  const int socket = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
  if (socket < 0) {
    return;
  }
  if (connections_.size() >= kMostConnections) {
    for (auto connection = connections_.begin(); connection != connections_.end(); ++connection) {
      if (!connection->second->is_asked) {
        connections_.erase(connection);
        break;
      }
    }
  }
  if (connections_.size() >= kMostConnections) {
    close(socket);
    return;
  }
  setsockopt(socket, SOL_SOCKET, SO_SNDBUF, &kSendBufferBytes, sizeof kSendBufferBytes);
  auto connection = std::make_unique<Connection>();
  connection->socket = socket;
  const int64_t id = ++accepted_;
  connection->readable = std::make_unique<Readable>(loop_, socket, [this, id] { Read(id); });
  connections_[id] = std::move(connection);
}

void Control::Read(int64_t id) {
  Connection& connection = *connections_.at(id);
  char part[kMostRequestBytes];
  const ssize_t got = recv(connection.socket, part, sizeof part, 0);
  if (got < 0 && (errno == EAGAIN || errno == EINTR)) {
    return;
  }
  connection.request.append(part, static_cast<size_t>(got < 0 ? 0 : got));
  const size_t end = connection.request.find('\n');
  if (got <= 0 || connection.is_asked || connection.request.size() > kMostRequestBytes) {
    connections_.erase(id);  // gone, or not to be talked with
    return;
  }
  if (end == std::string::npos) {
    return;
  }
  connection.is_asked = true;
  const std::optional<Json::Value> request = JsonFromText(connection.request.substr(0, end));
  if (!request || !request->isObject()) {
    Answer(id, Refusal("the request is no JSON object"));
    return;
  }
  handler_(*request, [this, id](const Json::Value& answer) { Answer(id, answer); });
}

// Whoever asked may be gone by now.
void Control::Answer(int64_t id, const Json::Value& answer) {
  const auto connection = connections_.find(id);
  if (connection == connections_.end()) {
    return;
  }
  const std::string line = JsonLine(answer) + "\n";
  send(connection->second->socket, line.data(), line.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  connections_.erase(connection);
}

}  // namespace quendeld
