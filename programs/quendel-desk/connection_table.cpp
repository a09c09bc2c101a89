// The open connections: how many each address has, and until when each may stay.
#include "connection_table.h"

#include <sys/socket.h>

namespace quendeldesk {

bool ConnectionTable::Add(int descriptor, const std::string& address, Clock::time_point deadline) {
  const std::lock_guard<std::mutex> lock(mutex_);
  // A connection that ended before it was served leaves its entry behind; its descriptor is new.
  RemoveLocked(descriptor);
  const auto found = per_address_.find(address);
  if (found != per_address_.end() && found->second >= limits_.connections_per_address) {
    return false;
  }
  if (entries_.size() >= limits_.connections && !MakeRoom()) {
    return false;
  }
  entries_[descriptor] = {address, deadline};
  ++per_address_[address];
  return true;
}

void ConnectionTable::Remove(int descriptor) {
  const std::lock_guard<std::mutex> lock(mutex_);
  RemoveLocked(descriptor);
}

void ConnectionTable::RemoveLocked(int descriptor) {
  const auto entry = entries_.find(descriptor);
  if (entry == entries_.end()) {
    return;
  }
  const auto count = per_address_.find(entry->second.address);
  if (--count->second == 0) {
    per_address_.erase(count);
  }
  entries_.erase(entry);
}

// A little above the limit is no harm: the descriptor leaves the table when it has been closed.
bool ConnectionTable::MakeRoom() {
  auto oldest = entries_.end();
  for (auto entry = entries_.begin(); entry != entries_.end(); ++entry) {
    if (entry->second.owes_head && !entry->second.cut &&
        (oldest == entries_.end() || entry->second.deadline < oldest->second.deadline)) {
      oldest = entry;
    }
  }
  if (oldest == entries_.end()) {
    return false;
  }
  oldest->second.cut = true;
  shutdown(oldest->first, SHUT_RDWR);
  return true;
}

void ConnectionTable::WaitForHead(int descriptor, Clock::time_point deadline) {
  Set(descriptor, true, deadline);
}

void ConnectionTable::WaitForMore(int descriptor, Clock::time_point deadline) {
  Set(descriptor, false, deadline);
}

void ConnectionTable::Set(int descriptor, bool owesHead, Clock::time_point deadline) {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto entry = entries_.find(descriptor);
  if (entry != entries_.end()) {
    entry->second.owes_head = owesHead;
    entry->second.deadline = deadline;
  }
}

size_t ConnectionTable::CutOverdue(Clock::time_point now) {
  const std::lock_guard<std::mutex> lock(mutex_);
  size_t cut = 0;
  for (auto& [descriptor, entry] : entries_) {
    if (entry.deadline < now && !entry.cut) {
      entry.cut = true;
      shutdown(descriptor, SHUT_RDWR);
      ++cut;
    }
  }
  return cut;
}

size_t ConnectionTable::size() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return entries_.size();
}

}  // namespace quendeldesk
