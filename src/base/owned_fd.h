// An owner for a file descriptor.
#ifndef BASE_OWNED_FD_H_
#define BASE_OWNED_FD_H_

#include <unistd.h>

#include <cerrno>
#include <utility>

namespace quendel {

// Closes its descriptor when it goes. A negative one is none. Only Close() tells errno what became
// of the closing: what went wrong before an owner goes is what its user reports.
class OwnedFd {
 public:
  explicit OwnedFd(int fd = -1) : fd_(fd) {}
  OwnedFd(OwnedFd&& other) noexcept : fd_(other.Release()) {}
  ~OwnedFd() { CloseQuietly(); }
  OwnedFd& operator=(OwnedFd&& other) noexcept {
    const int fd = other.Release();
    CloseQuietly();
    fd_ = fd;
    return *this;
  }
  OwnedFd(const OwnedFd&) = delete;
  OwnedFd& operator=(const OwnedFd&) = delete;

  explicit operator bool() const { return fd_ >= 0; }
  int get() const { return fd_; }

  // Gives the descriptor to the caller, who closes it.
  int Release() { return std::exchange(fd_, -1); }

  // Closes now. Returns false when the system reports that something written is lost.
  bool Close() {
    const int fd = Release();
    return fd < 0 || close(fd) == 0;
  }

 private:
  void CloseQuietly() {
    const int reason = errno;
    Close();
    errno = reason;
  }

  int fd_;
};

}  // namespace quendel

#endif  // BASE_OWNED_FD_H_
