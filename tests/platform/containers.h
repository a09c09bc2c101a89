// What the platform's containers hold, as values that matchers can compare.
#ifndef TESTS_PLATFORM_CONTAINERS_H_
#define TESTS_PLATFORM_CONTAINERS_H_

#include <map>
#include <string>
#include <vector>

#include "platform/owned.h"

namespace quendel::test {

inline std::vector<std::string> Texts(const platform::OwnedList& list) {
  std::vector<std::string> texts;
  for (int i = 0; i < ALIBCSzListSize(list.get()); ++i) {
    texts.emplace_back(ALIBCSzListGet(list.get(), i));
  }
  return texts;
}

inline std::map<std::string, std::string> Pairs(const platform::OwnedHash& hash) {
  platform::OwnedList keys(0);
  ALIBCSzHashEnumKey(hash.get(), keys.slot());
  std::map<std::string, std::string> pairs;
  for (const std::string& key : Texts(keys)) {
    pairs[key] = ALIBCSzHashGetValue(hash.get(), key.c_str());
  }
  return pairs;
}

}  // namespace quendel::test

#endif  // TESTS_PLATFORM_CONTAINERS_H_
