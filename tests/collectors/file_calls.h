// The system calls that move a log's bytes, as a test wants them to answer.
//
// A test program that links file_calls.cpp has these calls pass through the hooks below, which are
// empty at first: then the real call is made.
#ifndef TESTS_COLLECTORS_FILE_CALLS_H_
#define TESTS_COLLECTORS_FILE_CALLS_H_

#include <sys/stat.h>
#include <sys/types.h>

#include <functional>
#include <string>

namespace quendel::test {

struct FileCalls {
  // Each may do something first, and change the number of bytes that are asked for. When it returns
  // false the call fails, with the errno that the hook has set.
  std::function<bool(size_t& count)> copy_file_range;
  std::function<bool(size_t& count)> sendfile;
  std::function<bool(size_t& count)> pread;
  std::function<bool(size_t& count)> write;
  // Returns false for a file whose last bytes are to be lost when it is closed, with EIO. It is
  // closed all the same.
  std::function<bool(int file)> close;
  // Returns false for a path whose removal is to fail with EPERM.
  std::function<bool(const char* path)> remove;
  // Changes what stat() has told of a path.
  std::function<void(const char* path, struct stat& status)> stat;
};

FileCalls& OnFileCalls();

// A hook for a call that always fails with this errno.
std::function<bool(size_t&)> FailsWith(int error);

// The path of an open file.
std::string PathOfDescriptor(int file);

// A hook that does something at the first call and lets every call pass.
std::function<bool(size_t&)> Once(std::function<void()> action);

}  // namespace quendel::test

#endif  // TESTS_COLLECTORS_FILE_CALLS_H_
