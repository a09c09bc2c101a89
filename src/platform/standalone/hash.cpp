// The string-to-string hash.
#include "platform/hash.h"

#include <algorithm>
#include <functional>
#include <memory>

#include "platform/standalone/container.h"
#include "platform/standalone/error_code.h"

std::vector<std::string> platform::SortedKeys(const ALIBSZHASH& hash) {
  std::vector<std::string> keys;
  keys.reserve(hash.pairs.size());
  for (const auto& pair : hash.pairs) {
    keys.push_back(pair.first);
  }
  std::sort(keys.begin(), keys.end(), std::greater<>());
  return keys;
}

ALIBSZHASH* ALIBCSzHashAlloc(int size) try {
  if (size < 0) {
    platform::FailForArgument();
    return nullptr;
  }
  auto hash = std::make_unique<ALIBSZHASH>();
  hash->pairs.reserve(static_cast<size_t>(size));
  return hash.release();
} catch (...) {
  platform::FailForException();
  return nullptr;
}

void ALIBCSzHashFree(ALIBSZHASH* hash) {
  delete hash;
}

const char* ALIBCSzHashGetValue(ALIBSZHASH* hash, const char* key) try {
  if (hash == nullptr || key == nullptr) {
    platform::FailForArgument();
    return nullptr;
  }
  const auto pair = hash->pairs.find(key);
  return pair == hash->pairs.end() ? nullptr : pair->second.c_str();
} catch (...) {
  platform::FailForException();
  return nullptr;
}

int ALIBCSzHashSetValue(ALIBSZHASH** hash, const char* key, const char* value) try {
  if (hash == nullptr || *hash == nullptr || key == nullptr || value == nullptr) {
    return platform::FailForArgument();
  }
  // The copy comes first: the value may be one that this hash keeps.
  std::string copy = value;
  (*hash)->pairs[key] = std::move(copy);
  return 0;
} catch (...) {
  return platform::FailForException();
}

void ALIBCHashRemoveAll(ALIBSZHASH* hash) {
  if (hash != nullptr) {
    hash->pairs.clear();
  }
}

int ALIBCSzHashEnumKey(ALIBSZHASH* hash, ALIBSZLIST** keys) try {
  if (hash == nullptr || keys == nullptr || *keys == nullptr) {
    return platform::FailForArgument();
  }
  std::vector<std::string> sorted = platform::SortedKeys(*hash);
  std::vector<std::string>& texts = (*keys)->texts;
  // Once there is room for all of them nothing can fail, so the list never gets a part of the keys.
  texts.reserve(texts.size() + sorted.size());
  std::move(sorted.begin(), sorted.end(), std::back_inserter(texts));
  return static_cast<int>(hash->pairs.size());
} catch (...) {
  return platform::FailForException();
}
