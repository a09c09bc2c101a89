// Tells whether the server can be reached, before a collection spends time on gathering data.
#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include "base/log.h"
#include "quendel/conf.h"
#include "quendel/transport.h"
#include "transport/curl_session.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "util.cpp";

constexpr int kAttempts = 6;
constexpr unsigned int kPauseSeconds = 1;

// Looks the host up. Returns its first IPv4 address as dotted text, or an empty text.
std::string FirstAddress(const std::string& host) {
  const hostent* found = gethostbyname(host.c_str());
  if (found == nullptr || found->h_addrtype != AF_INET || found->h_addr_list[0] == nullptr) {
    return {};
  }
  return inet_ntoa(*reinterpret_cast<const in_addr*>(found->h_addr_list[0]));
}

bool ConnectOnce(const std::string& dottedAddress) {
  sockaddr_in server = {};
  server.sin_family = AF_INET;
  server.sin_port = htons(kServerPort);
  server.sin_addr.s_addr = inet_addr(dottedAddress.c_str());

  const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (connect(fd, reinterpret_cast<const sockaddr*>(&server), sizeof server) != 0) {
    QUENDEL_LOG("connect to a socket failed, errno: %m");
    return false;  // Deliberate: the socket of a failed attempt stays open.
  }
  close(fd);
  return true;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELIsServerReachable() try {
  const std::string host = QUENDELGetServerHost();
  const std::string address = FirstAddress(host);
  if (address.empty()) {
    QUENDEL_LOG("Failed to get IP address of target hostname: %s", host.c_str());
    return 0;
  }
  bool previousConnected = false;
  for (int left = kAttempts;;) {
    const bool connected = ConnectOnce(address);
    if (connected && previousConnected) {
      return 1;
    }
    previousConnected = connected;
    if (--left == 0) {
      return 0;
    }
    sleep(kPauseSeconds);
  }
} catch (...) {
  QUENDEL_LOG("Failed to get IP address of target hostname: %s", "");
  return 0;
}
