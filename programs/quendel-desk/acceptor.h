// Takes connections and hands them on.
#ifndef QUENDEL_DESK_ACCEPTOR_H_
#define QUENDEL_DESK_ACCEPTOR_H_

#include <sys/socket.h>

#include <cstdint>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "connection_table.h"
#include "descriptor.h"

namespace quendeldesk {

// The text of an address by which connections and requests are counted: an IPv4 address, or the 64
// bits of an IPv6 address that name its network.
std::string CountedAddress(const sockaddr* address);

class Acceptor {
 public:
  // Takes over the descriptor, with the address of who connected. Called on the acceptor's thread.
  using Hand = std::function<void(int descriptor, const sockaddr* address, socklen_t size)>;

  Acceptor(ConnectionTable& table, std::chrono::seconds headTime);
  ~Acceptor();

  // Listens on host (an address, or empty for every one) and port. Throws when that is impossible.
  // Each port counts for itself how many connections an address has.
  void Listen(const std::string& host, uint16_t port, Hand hand);
  void Start();
  void Stop();

 private:
  struct Listener {
    Descriptor descriptor;
    uint16_t port;
    Hand hand;
  };

  void Run();
  void AcceptAll(const Listener& listener);
  void Take(const Listener& listener, int connection, const sockaddr_storage& address,
            socklen_t size);

  ConnectionTable& table_;
  const std::chrono::seconds head_time_;
  std::vector<Listener> listeners_;
  Descriptor stop_;
  std::thread thread_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_ACCEPTOR_H_
