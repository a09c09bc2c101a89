// The .xz format, without starting a program.
#ifndef TESTS_SUPPORT_XZ_H_
#define TESTS_SUPPORT_XZ_H_

#include <optional>
#include <string>

namespace quendel::test {

std::string Xz(const std::string& plain);

// Returns nothing for bytes that "xz -d" refuses.
std::optional<std::string> Unxz(const std::string& bytes);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_XZ_H_
