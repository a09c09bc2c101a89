// JSON in tests.
#ifndef TESTS_SUPPORT_JSON_H_
#define TESTS_SUPPORT_JSON_H_

#include <json/value.h>

#include <string>

#include "base/json_text.h"
#include "support/require.h"

namespace quendel::test {

// Returns the value that a text stands for; a text that is not JSON ends the test program.
inline Json::Value JsonOf(const std::string& text) {
  Json::Value value;
  Require(JsonFromText(text, value), "not JSON: " + text);
  return value;
}

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_JSON_H_
