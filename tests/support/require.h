// For what the kit itself cannot do without.
#ifndef TESTS_SUPPORT_REQUIRE_H_
#define TESTS_SUPPORT_REQUIRE_H_

#include <cstdio>
#include <cstdlib>
#include <string>

namespace quendel::test {

// Ends the program with a sentence when something that a test stands on is missing: going on would
// prove nothing.
inline void Require(bool holds, const char* otherwise) {
  if (!holds) {
    fprintf(stderr, "test kit: %s\n", otherwise);
    abort();
  }
}
inline void Require(bool holds, const std::string& otherwise) {
  Require(holds, otherwise.c_str());
}

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_REQUIRE_H_
