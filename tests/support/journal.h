// A list of texts that a process and the children it forks write to together.
#ifndef TESTS_SUPPORT_JOURNAL_H_
#define TESTS_SUPPORT_JOURNAL_H_

#include <atomic>
#include <cstddef>
#include <string>
#include <vector>

namespace quendel::test {

// Lives in memory that forked children share. Each text goes in whole, whatever its length and
// however many processes and threads add at once.
class Journal {
 public:
  Journal();
  Journal(const Journal&) = delete;
  Journal& operator=(const Journal&) = delete;

  void Add(const std::string& text);
  std::vector<std::string> Texts() const;
  void Clear();

 private:
  struct Shared;
  Shared* shared_;
};

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_JOURNAL_H_
