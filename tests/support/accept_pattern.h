// A server that takes some connections and refuses others.
#ifndef TESTS_SUPPORT_ACCEPT_PATTERN_H_
#define TESTS_SUPPORT_ACCEPT_PATTERN_H_

#include <cstddef>
#include <string>

namespace quendel::test {

// Listens on port 51790 of 127.0.0.1, or does not: connection attempt n is accepted where character
// n of the pattern is "a" and refused where it is "r". The next attempt begins at the next counted
// sleep; after the last character every attempt is refused. Nothing is read or sent.
class AcceptPattern {
 public:
  explicit AcceptPattern(std::string pattern);
  ~AcceptPattern();
  AcceptPattern(const AcceptPattern&) = delete;
  AcceptPattern& operator=(const AcceptPattern&) = delete;

 private:
  void Apply();

  const std::string pattern_;
  size_t attempt_ = 0;
  int listener_ = -1;
};

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_ACCEPT_PATTERN_H_
