// The system calls that move a log's bytes, as a test wants them to answer.
#include "collectors/file_calls.h"

#include <sys/sendfile.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>
#include <utility>

namespace quendel::test {

FileCalls& OnFileCalls() {
  static FileCalls calls;
  return calls;
}

std::function<bool(size_t&)> FailsWith(int error) {
  return [error](size_t&) {
    errno = error;
    return false;
  };
}

std::string PathOfDescriptor(int file) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(file), error);
}

std::function<bool(size_t&)> Once(std::function<void()> action) {
  return [action = std::move(action), done = false](size_t&) mutable {
    if (!std::exchange(done, true)) {
      action();
    }
    return true;
  };
}

}  // namespace quendel::test

namespace {

bool Passes(const std::function<bool(size_t&)>& hook, size_t& count) {
  return !hook || hook(count);
}

}  // namespace

using quendel::test::OnFileCalls;

extern "C" {

ssize_t __real_copy_file_range(int in, off64_t* inOffset, int out, off64_t* outOffset, size_t count,
                               unsigned flags);
ssize_t __wrap_copy_file_range(int in, off64_t* inOffset, int out, off64_t* outOffset, size_t count,
                               unsigned flags) {
  return Passes(OnFileCalls().copy_file_range, count)
             ? __real_copy_file_range(in, inOffset, out, outOffset, count, flags)
             : -1;
}

ssize_t __real_sendfile(int out, int in, off_t* offset, size_t count);
ssize_t __wrap_sendfile(int out, int in, off_t* offset, size_t count) {
  return Passes(OnFileCalls().sendfile, count) ? __real_sendfile(out, in, offset, count) : -1;
}

ssize_t __real_pread(int file, void* buffer, size_t count, off_t offset);
ssize_t __wrap_pread(int file, void* buffer, size_t count, off_t offset) {
  return Passes(OnFileCalls().pread, count) ? __real_pread(file, buffer, count, offset) : -1;
}

ssize_t __real_write(int file, const void* buffer, size_t count);
ssize_t __wrap_write(int file, const void* buffer, size_t count) {
  return Passes(OnFileCalls().write, count) ? __real_write(file, buffer, count) : -1;
}

int __real_close(int file);
int __wrap_close(int file) {
  const bool isLost = OnFileCalls().close && !OnFileCalls().close(file);
  const int result = __real_close(file);
  if (isLost) {
    errno = EIO;
    return -1;
  }
  return result;
}

int __real_remove(const char* path);
int __wrap_remove(const char* path) {
  if (OnFileCalls().remove && !OnFileCalls().remove(path)) {
    errno = EPERM;
    return -1;
  }
  return __real_remove(path);
}

int __real_stat(const char* path, struct stat* status);
int __wrap_stat(const char* path, struct stat* status) {
  const int result = __real_stat(path, status);
  if (result == 0 && OnFileCalls().stat) {
    OnFileCalls().stat(path, *status);
  }
  return result;
}
}
