#include "common/control_socket.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace quendel::programs {
namespace {

int Connect() {
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, kControlSocket, sizeof address.sun_path - 1);
  if (socket >= 0 &&
      connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
    return socket;
  }
  const int reason = errno;
  if (socket >= 0) {
    close(socket);
  }
  errno = reason;
  return -1;
}

std::optional<std::string> ReadLine(int socket) {
  std::string line;
  char part[8192];
  ssize_t got = 0;
  while (line.find('\n') == std::string::npos) {
    got = recv(socket, part, sizeof part, 0);
    if (got < 0 && errno == EINTR) {
      continue;
    }
    if (got <= 0) {
      errno = got == 0 ? ECONNRESET : errno;
      return std::nullopt;
    }
    line.append(part, static_cast<size_t>(got));
  }
  return line.substr(0, line.find('\n'));
}

}  // namespace

std::optional<std::string> AskDaemon(const std::string& request) {
  const int socket = Connect();
  if (socket < 0) {
    return std::nullopt;
  }
  const std::string line = request + "\n";
  std::optional<std::string> answer;
  if (send(socket, line.data(), line.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(line.size())) {
    answer = ReadLine(socket);
  }
  const int reason = errno;
  close(socket);
  errno = reason;
  return answer;
}

}  // namespace quendel::programs
