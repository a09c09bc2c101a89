// A list of texts that a process and the children it forks write to together.
#include "support/journal.h"

#include <sys/mman.h>

#include <cstdint>
#include <cstring>

#include "support/require.h"

namespace quendel::test {
namespace {

// Only pages that are written to take memory.
constexpr size_t kCapacity = size_t{1} << 30;

// Stands in front of each text. `done` is set last, so that a reader never sees half a text.
struct Entry {
  std::atomic<uint32_t> size;
  std::atomic<uint32_t> done;

  char* text() { return reinterpret_cast<char*>(this + 1); }
};

size_t EntryBytes(size_t textSize) {
  return (sizeof(Entry) + textSize + alignof(Entry) - 1) / alignof(Entry) * alignof(Entry);
}

}  // namespace

struct Journal::Shared {
  std::atomic<size_t> used;
  alignas(Entry) char bytes[kCapacity - sizeof(size_t)];

  Entry* At(size_t offset) { return reinterpret_cast<Entry*>(bytes + offset); }
};

Journal::Journal() {
  void* memory = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE,
                      MAP_SHARED | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  Require(memory != MAP_FAILED, "no memory for a journal");
  shared_ = static_cast<Shared*>(memory);
}

void Journal::Add(const std::string& text) {
  const size_t offset = shared_->used.fetch_add(EntryBytes(text.size()));
  Require(offset + EntryBytes(text.size()) <= sizeof shared_->bytes, "a journal is full");
  Entry* entry = shared_->At(offset);
  entry->size = static_cast<uint32_t>(text.size());
  memcpy(entry->text(), text.data(), text.size());
  entry->done = 1;
}

// A process that was killed while it added a text leaves a gap, which is passed over.
std::vector<std::string> Journal::Texts() const {
  std::vector<std::string> texts;
  const size_t used = shared_->used;
  for (size_t offset = 0; offset < used;) {
    Entry* entry = shared_->At(offset);
    if (entry->done != 0) {
      texts.emplace_back(entry->text(), entry->size);
    }
    offset += EntryBytes(entry->size);
  }
  return texts;
}

void Journal::Clear() {
  // Gives the pages back, which zeroes them as a new journal's are.
  madvise(shared_, sizeof(Shared), MADV_REMOVE);
}

}  // namespace quendel::test
