// Takes connections and hands them on.
#include "acceptor.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/eventfd.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <system_error>

namespace quendeldesk {
namespace {

constexpr int kBetweenLooksMs = 250;  // how late a connection may be cut at most
constexpr size_t kNetworkBytes = 8;   // of an IPv6 address

struct FreeAddresses {
  void operator()(addrinfo* list) const { freeaddrinfo(list); }
};
using Addresses = std::unique_ptr<addrinfo, FreeAddresses>;

Addresses Resolve(const std::string& host, uint16_t port) {
  addrinfo hints = {};
  hints.ai_family = host.empty() ? AF_INET6 : AF_UNSPEC;
  hints.ai_socktype = SOCK_STREAM;
  hints.ai_flags = AI_PASSIVE | AI_NUMERICHOST | AI_NUMERICSERV;
  addrinfo* list = nullptr;
  const char* name = host.empty() ? "::" : host.c_str();
  const int error = getaddrinfo(name, std::to_string(port).c_str(), &hints, &list);
  if (error != 0) {
    throw std::runtime_error("cannot listen on " + host + ": " + gai_strerror(error));
  }
  return Addresses(list);
}

Descriptor BoundSocket(const addrinfo& address) {
  Descriptor listener(socket(address.ai_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  const int on = 1;
  const int off = 0;
  if (!listener) {
    return listener;
  }
  setsockopt(listener.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
  if (address.ai_family == AF_INET6) {
    setsockopt(listener.get(), IPPROTO_IPV6, IPV6_V6ONLY, &off, sizeof(off));
  }
  if (bind(listener.get(), address.ai_addr, address.ai_addrlen) != 0 ||
      listen(listener.get(), SOMAXCONN) != 0) {
    return Descriptor();
  }
  return listener;
}

}  // namespace

std::string CountedAddress(const sockaddr* address) {
  char text[INET6_ADDRSTRLEN] = "";
  if (address->sa_family == AF_INET) {
    const auto* v4 = reinterpret_cast<const sockaddr_in*>(address);
    return inet_ntop(AF_INET, &v4->sin_addr, text, sizeof(text));
  }
  if (address->sa_family != AF_INET6) {
    return "local";
  }
  in6_addr v6 = reinterpret_cast<const sockaddr_in6*>(address)->sin6_addr;
  if (IN6_IS_ADDR_V4MAPPED(&v6)) {
    return inet_ntop(AF_INET, &v6.s6_addr[12], text, sizeof(text));
  }
  if (!IN6_IS_ADDR_LOOPBACK(&v6)) {
    memset(&v6.s6_addr[kNetworkBytes], 0, sizeof(v6.s6_addr) - kNetworkBytes);
  }
  return inet_ntop(AF_INET6, &v6, text, sizeof(text));
}

Acceptor::Acceptor(ConnectionTable& table, std::chrono::seconds headTime)
    : table_(table), head_time_(headTime), stop_(eventfd(0, EFD_CLOEXEC)) {
}

Acceptor::~Acceptor() {
  Stop();
}

void Acceptor::Listen(const std::string& host, uint16_t port, Hand hand) {
  Descriptor listener = BoundSocket(*Resolve(host, port));
  if (!listener && host.empty() && errno == EAFNOSUPPORT) {
    listener = BoundSocket(*Resolve("0.0.0.0", port));
  }
  if (!listener) {
    throw std::system_error(errno, std::generic_category(),
                            "cannot listen on port " + std::to_string(port));
  }
  listeners_.push_back({std::move(listener), port, std::move(hand)});
}

void Acceptor::Start() {
  thread_ = std::thread(&Acceptor::Run, this);
}

void Acceptor::Stop() {
  if (thread_.joinable()) {
    eventfd_write(stop_.get(), 1);
    thread_.join();
  }
}

void Acceptor::Run() {
  std::vector<pollfd> waits = {{stop_.get(), POLLIN, 0}};
  for (const Listener& listener : listeners_) {
    waits.push_back({listener.descriptor.get(), POLLIN, 0});
  }
  while (waits[0].revents == 0) {
    poll(waits.data(), waits.size(), kBetweenLooksMs);
    for (size_t i = 0; i < listeners_.size(); ++i) {
      if (waits[i + 1].revents != 0) {
        AcceptAll(listeners_[i]);
      }
    }
    table_.CutOverdue(Clock::now());
  }
}

// In turns, so that a flood on one port cannot keep the acceptor from the other and the deadlines.
void Acceptor::AcceptAll(const Listener& listener) {
  constexpr int kMostAtOnce = 64;
  for (int i = 0; i < kMostAtOnce; ++i) {
    sockaddr_storage address = {};
    socklen_t size = sizeof(address);
    const int connection = accept4(listener.descriptor.get(), reinterpret_cast<sockaddr*>(&address),
                                   &size, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (connection >= 0) {
      Take(listener, connection, address, size);
    } else if (errno == EMFILE || errno == ENFILE || errno == ENOMEM || errno == ENOBUFS) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));  // until something is closed
      return;
    } else if (errno != EINTR && errno != ECONNABORTED) {
      return;
    }
  }
}

void Acceptor::Take(const Listener& listener, int connection, const sockaddr_storage& address,
                    socklen_t size) {
  const auto* who = reinterpret_cast<const sockaddr*>(&address);
  const std::string counted = std::to_string(listener.port) + " " + CountedAddress(who);
  if (table_.Add(connection, counted, Clock::now() + head_time_)) {
    listener.hand(connection, who, size);
  } else {
    close(connection);
  }
}

}  // namespace quendeldesk
