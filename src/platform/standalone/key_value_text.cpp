// The grammar of key-value files.
#include "platform/standalone/key_value_text.h"

#include <algorithm>

namespace platform {
namespace {

constexpr char kBlanks[] = " \t";

// What may follow a backslash in a quoted value, and what the two stand for.
constexpr struct {
  char letter;
  char meaning;
} kEscapes[] = {{'"', '"'}, {'\\', '\\'}, {'n', '\n'}, {'r', '\r'}, {'t', '\t'}};

std::string_view TrimBlanks(std::string_view text) {
  const size_t begin = text.find_first_not_of(kBlanks);
  if (begin == std::string_view::npos) {
    return text.substr(text.size());
  }
  return text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

bool IsQuoted(std::string_view written) {
  return written.size() > 2 && written.front() == '"' && written.back() == '"';
}

// A backslash in front of any other letter, or at the end, stands for itself.
std::string DecodeEscapes(std::string_view text) {
  std::string decoded;
  decoded.reserve(text.size());
  for (size_t i = 0; i < text.size(); ++i) {
    const char next = text[i] == '\\' && i + 1 < text.size() ? text[i + 1] : '\0';
    const auto escape = std::find_if(std::begin(kEscapes), std::end(kEscapes),
                                     [next](const auto& known) { return known.letter == next; });
    if (escape == std::end(kEscapes)) {
      decoded += text[i];
    } else {
      decoded += escape->meaning;
      ++i;
    }
  }
  return decoded;
}

std::string Quote(std::string_view value) {
  std::string quoted = "\"";
  for (const char c : value) {
    const auto escape = std::find_if(std::begin(kEscapes), std::end(kEscapes),
                                     [c](const auto& known) { return known.meaning == c; });
    if (escape == std::end(kEscapes)) {
      quoted += c;
    } else {
      quoted += '\\';
      quoted += escape->letter;
    }
  }
  return quoted + '"';
}

// The decoded value of the line "key=value" tells whether `value` survives being written raw.
bool SurvivesRaw(std::string_view value) {
  const bool losesLineEnd = value.find('\n') != std::string_view::npos || value.back() == '\r';
  return !losesLineEnd && TrimBlanks(value) == value && !IsQuoted(value);
}

}  // namespace

bool Lines::Next(Line& line) {
  if (next_ >= text_.size()) {
    return false;
  }
  const size_t newline = text_.find('\n', next_);
  line.complete = newline != std::string_view::npos;
  line.begin = next_;
  line.end = line.complete ? newline + 1 : text_.size();
  line.text = text_.substr(line.begin, line.end - line.begin - (line.complete ? 1 : 0));
  if (!line.text.empty() && line.text.back() == '\r') {
    line.text.remove_suffix(1);
  }
  next_ = line.end;
  return true;
}

bool ParsePair(std::string_view line, WrittenPair& pair) {
  const size_t equals = line.find('=');
  const size_t begin = line.find_first_not_of(kBlanks);
  if (equals == std::string_view::npos || begin == equals) {
    return false;
  }
  if (line[begin] == '#' || line[begin] == ';' || line[begin] == '[') {
    return false;
  }
  pair.key = TrimBlanks(line.substr(begin, equals - begin));
  pair.value = TrimBlanks(line.substr(equals + 1));
  return pair.key.find('\0') == std::string_view::npos;
}

bool FindPair(std::string_view text, std::string_view key, WrittenPair& pair) {
  bool found = false;
  Lines lines(text);
  Line line;
  WrittenPair candidate;
  while (lines.Next(line)) {
    if (ParsePair(line.text, candidate) && candidate.key == key) {
      pair = candidate;
      found = true;
    }
  }
  return found;
}

bool ParseSectionName(std::string_view line, std::string_view& name) {
  const size_t open = line.find_first_not_of(kBlanks);
  if (open == std::string_view::npos || line[open] != '[') {
    return false;
  }
  const size_t close = line.rfind(']');
  if (close == std::string_view::npos) {
    return false;
  }
  name = line.substr(open + 1, close - open - 1);
  return true;
}

std::string DecodeValue(std::string_view written) {
  std::string value = IsQuoted(written) ? DecodeEscapes(written.substr(1, written.size() - 2))
                                        : std::string(written);
  // find() gives npos, which resizing must not see, for a value without a NUL.
  value.resize(std::min(value.find('\0'), value.size()));
  return value;
}

std::string EncodeValue(std::string_view value) {
  return value.empty() || SurvivesRaw(value) ? std::string(value) : Quote(value);
}

bool IsWritableKey(std::string_view key) {
  WrittenPair pair;
  return key.find('\n') == std::string_view::npos && ParsePair(std::string(key) + "=", pair) &&
         pair.key == key;
}

}  // namespace platform
