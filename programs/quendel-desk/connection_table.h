// The open connections: how many each address has, and until when each may stay.
#ifndef QUENDEL_DESK_CONNECTION_TABLE_H_
#define QUENDEL_DESK_CONNECTION_TABLE_H_

#include <chrono>
#include <map>
#include <mutex>
#include <string>
#include <unordered_map>

namespace quendeldesk {

using Clock = std::chrono::steady_clock;

struct ConnectionLimits {
  size_t connections = 4096;
  size_t connections_per_address = 256;
};

// The library that serves the connections counts only idle time, so a client that drips a byte now
// and then would stay for ever. Here each connection has a moment by which it must have got
// further; its descriptor is shut down when it has not.
class ConnectionTable {
 public:
  explicit ConnectionTable(const ConnectionLimits& limits) : limits_(limits) {}

  // Enters a connection that has to send the whole head of a request by `deadline`. When the table
  // is full, the one that owes its head for longest is shut down in its place. Returns false when
  // the address has as many as it may have, or nobody can make room.
  bool Add(int descriptor, const std::string& address, Clock::time_point deadline);
  void Remove(int descriptor);

  void WaitForHead(int descriptor, Clock::time_point deadline);
  void WaitForMore(int descriptor, Clock::time_point deadline);

  // Shuts down what is overdue. Returns how many that were.
  size_t CutOverdue(Clock::time_point now);
  size_t size() const;

 private:
  struct Entry {
    std::string address;
    Clock::time_point deadline;
    bool owes_head = true;
    bool cut = false;
  };

  void RemoveLocked(int descriptor);
  bool MakeRoom();
  void Set(int descriptor, bool owesHead, Clock::time_point deadline);

  const ConnectionLimits limits_;
  mutable std::mutex mutex_;
  std::unordered_map<int, Entry> entries_;
  std::map<std::string, size_t> per_address_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_CONNECTION_TABLE_H_
