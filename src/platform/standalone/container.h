// What the platform's containers are made of, for the operations that fill them.
#ifndef PLATFORM_STANDALONE_CONTAINER_H_
#define PLATFORM_STANDALONE_CONTAINER_H_

#include <string>
#include <unordered_map>
#include <vector>

#include "platform/hash.h"
#include "platform/list.h"

struct ALIBSZHASH {
  std::unordered_map<std::string, std::string> pairs;
};

struct ALIBSZLIST {
  std::vector<std::string> texts;
};

namespace platform {

// Returns a hash's keys in the order that ALIBCSzHashEnumKey() promises.
std::vector<std::string> SortedKeys(const ALIBSZHASH& hash);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_CONTAINER_H_
