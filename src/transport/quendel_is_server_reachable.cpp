// Tells whether the server can be reached, before a collection spends time on gathering data.
#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include "base/log.h"
#include "conf/server_host.h"
#include "quendel/transport.h"
#include "transport/curl_session.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "util.cpp";

constexpr int kAttempts = 6;
constexpr unsigned int kPauseSeconds = 1;

// Looks the host up. Returns its first IPv4 address as dotted text, in a buffer of the C library,
// or null.
const char* FirstAddress(const char* host) {
  const hostent* found = gethostbyname(host);
  if (found == nullptr || found->h_addrtype != AF_INET || found->h_addr_list[0] == nullptr) {
    return nullptr;
  }
  return inet_ntoa(*reinterpret_cast<const in_addr*>(found->h_addr_list[0]));
}

bool ConnectOnce(const char* dottedAddress) {
  sockaddr_in server = {};
  server.sin_family = AF_INET;
  server.sin_port = htons(kServerPort);
  server.sin_addr.s_addr = inet_addr(dottedAddress);

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

int QUENDELIsServerReachable() {
  const char* const host = ServerHost();
  const char* const address = FirstAddress(host);
  if (address == nullptr) {
    QUENDEL_LOG("Failed to get IP address of target hostname: %s", host);
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
}
