// One value of the platform's hash, for callers that must not take a lack of memory for a missing
// key.
#ifndef CONF_HASH_VALUE_H_
#define CONF_HASH_VALUE_H_

#include <string>

#include "platform/hash.h"

namespace quendel {

// Returns a copy of the value, or an empty text when the hash does not have the key. Throws
// std::bad_alloc, where QUENDELGetHashValue() returns an empty text.
inline std::string HashValue(ALIBSZHASH* hash, const char* key) {
  const char* value = ALIBCSzHashGetValue(hash, key);
  return value == nullptr ? std::string() : std::string(value);
}

}  // namespace quendel

#endif  // CONF_HASH_VALUE_H_
