// Descriptors that close themselves, and files read and written whole.
#ifndef PLATFORM_STANDALONE_FILE_IO_H_
#define PLATFORM_STANDALONE_FILE_IO_H_

#include <sys/stat.h>

#include <string>
#include <string_view>

namespace platform {

// Owns a file descriptor. Its destructor leaves errno as it was, because what went wrong before it
// ran is what the caller reports.
class Descriptor {
 public:
  explicit Descriptor(int fd = -1) : fd_(fd) {}
  Descriptor(Descriptor&& other) noexcept : fd_(other.Release()) {}
  Descriptor& operator=(Descriptor&& other) noexcept;
  ~Descriptor() { Reset(-1); }

  explicit operator bool() const { return fd_ >= 0; }
  int get() const { return fd_; }
  int Release();
  void Reset(int fd);

 private:
  int fd_;
};

// Opens a regular file for reading, close-on-exec. Anything else that the path names is refused at
// once: opening a FIFO or a device never blocks. `status` gets what fstat() tells of the open file.
// Returns a descriptor that is false, with the last error set, on failure.
Descriptor OpenRegularFile(const char* path, struct stat* status);

// Reads from the descriptor's position to the end, in large blocks; `sizeHint` saves allocations.
// Returns false with the last error set when a read fails; the end of a file is not a failure.
bool ReadToEnd(int fd, off_t sizeHint, std::string& text);

// Reads a regular file whole. Returns false with the last error set on failure.
bool ReadWholeFile(const char* path, std::string& text);

// Writes everything, however many calls that takes. Returns false with errno set on failure.
bool WriteAll(int fd, std::string_view text);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_FILE_IO_H_
