// A file descriptor that is closed with its owner, and what is read from one to another.
#ifndef QUENDEL_DESK_DESCRIPTOR_H_
#define QUENDEL_DESK_DESCRIPTOR_H_

#include <sys/sendfile.h>
#include <unistd.h>

#include <utility>

namespace quendeldesk {

class Descriptor {
 public:
  Descriptor() = default;
  explicit Descriptor(int descriptor) : descriptor_(descriptor) {}
  Descriptor(Descriptor&& other) noexcept : descriptor_(other.release()) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    return *this;
  }
  ~Descriptor() {
    if (descriptor_ >= 0) {
      close(descriptor_);
    }
  }

  int get() const { return descriptor_; }
  explicit operator bool() const { return descriptor_ >= 0; }
  int release() { return std::exchange(descriptor_, -1); }

 private:
  int descriptor_ = -1;
};

// Writes what is left of the file `from` to the file `to`, on whatever file systems they are, and
// returns whether all of it is there.
inline bool CopyRest(int from, int to) {
  constexpr size_t kMostAtOnce = 1 << 30;
  ssize_t copied = 0;
  while ((copied = sendfile(to, from, nullptr, kMostAtOnce)) > 0) {
  }
  return copied == 0;
}

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DESCRIPTOR_H_
