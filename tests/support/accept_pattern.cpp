// A server that takes some connections and refuses others.
#include "support/accept_pattern.h"

#include <arpa/inet.h>
#include <sys/socket.h>
#include <unistd.h>

#include <utility>

#include "support/calls.h"
#include "support/own_work.h"
#include "support/require.h"

namespace quendel::test {
namespace {

constexpr uint16_t kPort = 51790;

// Backlog enough for every connection of a test: none is ever taken out.
constexpr int kBacklog = 16;

int Listen() {
  const OwnWork ownWork;  // a test counts the sockets
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_port = htons(kPort);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const int listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const int on = 1;
  setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
  Require(bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
              listen(listener, kBacklog) == 0,
          "cannot listen on port 51790");
  return listener;
}

}  // namespace

AcceptPattern::AcceptPattern(std::string pattern) : pattern_(std::move(pattern)) {
  Apply();
  On("sleep").Before([this] {
    ++attempt_;
    Apply();
  });
}

AcceptPattern::~AcceptPattern() {
  Restore("sleep");
  if (listener_ >= 0) {
    close(listener_);
  }
}

void AcceptPattern::Apply() {
  const bool accepts = attempt_ < pattern_.size() && pattern_[attempt_] == 'a';
  if (accepts && listener_ < 0) {
    listener_ = Listen();
  } else if (!accepts && listener_ >= 0) {
    close(listener_);
    listener_ = -1;
  }
}

}  // namespace quendel::test
