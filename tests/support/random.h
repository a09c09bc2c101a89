// Chance for tests that can be had again.
#ifndef TESTS_SUPPORT_RANDOM_H_
#define TESTS_SUPPORT_RANDOM_H_

#include <gtest/gtest.h>

#include <cstdlib>
#include <random>
#include <string>

namespace quendel::test {

// Whatever fails while one lives tells its seed. QUENDEL_TEST_SEED=7 in the environment plays a
// test again whose seed is another one each time.
class Random {
 public:
  // Another seed each time.
  Random() : Random(AnySeed(), "QUENDEL_TEST_SEED=") {}

  // Always the same.
  explicit Random(unsigned seed) : Random(seed, "seed ") {}

  // A number from 0 up to the limit, which is not reached.
  int Below(int limit) { return static_cast<int>(numbers_() % static_cast<unsigned>(limit)); }

  bool OneIn(int times) { return Below(times) == 0; }

  std::string Bytes(size_t count) {
    std::string bytes;
    bytes.reserve(count + sizeof(unsigned));
    while (bytes.size() < count) {
      const std::mt19937::result_type word = numbers_();
      bytes.append(reinterpret_cast<const char*>(&word), sizeof(uint32_t));
    }
    bytes.resize(count);
    return bytes;
  }

 private:
  Random(unsigned seed, const char* name)
      : trace_(__FILE__, __LINE__, name + std::to_string(seed)), numbers_(seed) {}

  static unsigned AnySeed() {
    const char* given = getenv("QUENDEL_TEST_SEED");
    return given != nullptr ? static_cast<unsigned>(std::stoul(given)) : std::random_device()();
  }

  testing::ScopedTrace trace_;
  std::mt19937 numbers_;
};

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_RANDOM_H_
