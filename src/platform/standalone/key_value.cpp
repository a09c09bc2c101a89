// Flat key-value files.
#include "platform/key_value.h"

#include <algorithm>
#include <climits>
#include <string>

#include "platform/standalone/container.h"
#include "platform/standalone/copy_text.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/key_value_text.h"
#include "platform/standalone/replace_file.h"

namespace platform {
namespace {

// What a new line of the file ends with: the same as the last of its lines that has an end.
const char* LineEndOf(const std::string& text) {
  const size_t newline = text.rfind('\n');
  const bool hasReturn = newline != std::string::npos && newline > 0 && text[newline - 1] == '\r';
  return hasReturn ? "\r\n" : "\n";
}

// What the last line lacks to be ended. A CR at its end is half of a line end already: a second one
// would become part of the value.
const char* MissingLineEnd(const std::string& text) {
  if (text.empty() || text.back() == '\n') {
    return "";
  }
  return text.back() == '\r' ? "\n" : LineEndOf(text);
}

std::string WithPairAdded(const std::string& text, const char* key, const std::string& written) {
  return text + MissingLineEnd(text) + key + '=' + written + LineEndOf(text);
}

// Only the value changes: the key, the blanks around it and the line end stay.
std::string WithValueSet(const std::string& text, const char* key, const std::string& written) {
  WrittenPair pair;
  if (!FindPair(text, key, pair)) {
    return WithPairAdded(text, key, written);
  }
  const size_t begin = static_cast<size_t>(pair.value.data() - text.data());
  return std::string(text).replace(begin, pair.value.size(), written);
}

}  // namespace
}  // namespace platform

int ALIBCFileGetKeyValue(const char* path, const char* key, char* buf, int size,
                         int /*flags*/) try {
  if (path == nullptr || key == nullptr || buf == nullptr) {
    return platform::FailForArgument();
  }
  std::string text;
  if (!platform::ReadWholeFile(path, text)) {
    return -1;
  }
  platform::WrittenPair pair;
  if (!platform::FindPair(text, key, pair)) {
    platform::Fail(platform::kErrorKeyNotFound);
    return 0;
  }
  const std::string value = platform::DecodeValue(pair.value);
  platform::CopyText(value, buf, static_cast<size_t>(std::max(size, 0)));
  if (value.empty()) {
    platform::Fail(platform::kErrorEmptyValue);
  }
  return static_cast<int>(std::min(value.size(), static_cast<size_t>(INT_MAX)));
} catch (...) {
  return platform::FailForException();
}

int ALIBCFileSetKeyValue(const char* path, const char* key, const char* value, int /*flags*/) try {
  if (path == nullptr || key == nullptr || value == nullptr || !platform::IsWritableKey(key)) {
    return platform::FailForArgument();
  }
  const std::string written = platform::EncodeValue(value);
  const auto change = [&](const std::string& text) {
    return platform::WithValueSet(text, key, written);
  };
  return platform::ChangeFile(path, change) == 0 ? 1 : -1;
} catch (...) {
  return platform::FailForException();
}

int ALIBCFileGetPair(const char* path, ALIBSZHASH** hash) try {
  if (path == nullptr || hash == nullptr || *hash == nullptr) {
    return platform::FailForArgument();
  }
  std::string text;
  if (!platform::ReadWholeFile(path, text)) {
    return -1;
  }
  int pairs = 0;
  platform::Lines lines(text);
  platform::Line line;
  platform::WrittenPair pair;
  while (lines.Next(line)) {
    if (platform::ParsePair(line.text, pair)) {
      (*hash)->pairs[std::string(pair.key)] = platform::DecodeValue(pair.value);
      ++pairs;
    }
  }
  return pairs;
} catch (...) {
  return platform::FailForException();
}
