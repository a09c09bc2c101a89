// Hands one block of bytes from one process to another through a System V shared-memory segment.
#include <sys/ipc.h>
#include <sys/shm.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>

#include "base/log.h"
#include "quendel/collect.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_shm_ipc";

constexpr int kEverybody = 0666;
constexpr int kAttempts = 20;
constexpr unsigned int kPauseSeconds = 1;

// The first byte of the segment is the whole synchronisation: what it holds tells who is next.
constexpr char kNothingWritten = 0;
constexpr char kAcknowledged = '*';

bool IsAttached(const void* segment) {
  return reinterpret_cast<intptr_t>(segment) != -1;
}

// The other side is another process, so each look must go to memory, and must see the block as it
// was written before or after the byte.
char Handshake(const void* segment) {
  return __atomic_load_n(static_cast<const char*>(segment), __ATOMIC_ACQUIRE);
}

void Acknowledge(void* segment) {
  __atomic_store_n(static_cast<char*>(segment), kAcknowledged, __ATOMIC_RELEASE);
}

// Looks once a second, and not before the first second is over. Returns false after the last look.
template <typename Condition>
bool WaitFor(Condition holds) {
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    sleep(kPauseSeconds);
    if (holds()) {
      return true;
    }
  }
  return false;
}

int SendThrough(void* segment, const char* data, size_t size) {
  if (!IsAttached(segment)) {
    QUENDEL_LOG("Failed to attach the segment to data space, errno: %m");
    return -1;
  }
  memcpy(segment, data, size);
  const auto acknowledged = [segment] { return Handshake(segment) == kAcknowledged; };
  // Deliberate: a block that begins with '*' counts as acknowledged at once.
  if (!acknowledged() && !WaitFor(acknowledged)) {
    QUENDEL_LOG("Receiver has not received data in memory");
    return -1;
  }
  return 0;
}

int ReceiveThrough(void* segment, char* buf, size_t size) {
  if (!IsAttached(segment)) {
    QUENDEL_LOG("Failed to attach the segment to data space, errno: %m");
    return -1;
  }
  const auto written = [segment] { return Handshake(segment) != kNothingWritten; };
  if (!written() && !WaitFor(written)) {
    QUENDEL_LOG("Sender has not put data in memory");
    return -1;
  }
  memcpy(buf, segment, size);
  Acknowledge(segment);
  return 0;
}

// Deliberate: tried until it succeeds, without a pause. Nobody else would ever remove the segment.
void MarkForRemoval(int id) {
  while (shmctl(id, IPC_RMID, nullptr) == -1) {
    QUENDEL_LOG("Failed to mark the segment to be destroyed, errno: %m");
  }
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELShmAlloc(size_t size, int key) {
  const int id = shmget(key, size, IPC_CREAT | kEverybody);
  if (id < 0) {
    QUENDEL_LOG("Failed to create the segment, errno: %m");
    return -1;
  }
  // Deliberate: the attachment stays until this process exits.
  if (!IsAttached(shmat(id, nullptr, 0))) {
    QUENDEL_LOG("Failed to attach the segment to data space, errno: %m");
    return -1;
  }
  return 0;
}

int QUENDELShmSend(char* data, size_t size, int key) {
  const int id = shmget(key, size, kEverybody);
  if (id < 0) {
    QUENDEL_LOG("Failed to locate the segment, errno: %m");
    return -2;
  }
  void* segment = shmat(id, nullptr, 0);
  const int result = SendThrough(segment, data, size);
  shmdt(segment);
  return result;
}

int QUENDELShmReceive(char* buf, size_t size, int key) {
  const int id = shmget(key, size, kEverybody);
  if (id < 0) {
    QUENDEL_LOG("Failed to locate the segment, errno: %m");
    return -2;
  }
  void* segment = shmat(id, nullptr, 0);
  const int result = ReceiveThrough(segment, buf, size);
  MarkForRemoval(id);
  shmdt(segment);
  return result;
}
