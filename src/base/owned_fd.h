// An owner for a file descriptor.
#ifndef BASE_OWNED_FD_H_
#define BASE_OWNED_FD_H_

#include <unistd.h>

#include <utility>

namespace quendel {

// Closes its descriptor when it goes. A negative one is none.
class OwnedFd {
 public:
  explicit OwnedFd(int fd = -1) : fd_(fd) {}
  OwnedFd(OwnedFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  ~OwnedFd() { Close(); }
  OwnedFd(const OwnedFd&) = delete;
  OwnedFd& operator=(const OwnedFd&) = delete;
  OwnedFd& operator=(OwnedFd&&) = delete;

  explicit operator bool() const { return fd_ >= 0; }
  int get() const { return fd_; }

  // Closes now. Returns false when the system reports that something written is lost.
  bool Close() {
    const int fd = std::exchange(fd_, -1);
    return fd < 0 || close(fd) == 0;
  }

 private:
  int fd_;
};

}  // namespace quendel

#endif  // BASE_OWNED_FD_H_
