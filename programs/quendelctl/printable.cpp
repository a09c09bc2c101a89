// Bytes from anywhere, made safe to show.
#include "printable.h"

#include <algorithm>
#include <array>
#include <cstdio>

namespace quendelctl {
namespace {

struct Character {
  size_t length;  // bytes; 0 when the text does not begin with a character in UTF-8
  char32_t code;
};

unsigned char ByteAt(std::string_view text, size_t index) {
  return static_cast<unsigned char>(text[index]);
}

// The length that the first byte of a character announces, 0 for a byte that begins none.
size_t AnnouncedLength(unsigned char first) {
  if (first < 0x80) {
    return 1;
  }
  if (first < 0xC2 || first > 0xF4) {
    return 0;
  }
  return first < 0xE0 ? 2 : first < 0xF0 ? 3 : 4;
}

Character FirstCharacter(std::string_view text) {
  static constexpr std::array<char32_t, 5> kSmallest = {0, 0, 0x80, 0x800, 0x10000};
  const size_t length = AnnouncedLength(ByteAt(text, 0));
  if (length < 2 || text.size() < length) {
    return {length == 1 ? length : 0, ByteAt(text, 0)};
  }
  char32_t code = ByteAt(text, 0) & (0xFFU >> (length + 1));
  for (size_t i = 1; i < length; ++i) {
    if ((ByteAt(text, i) & 0xC0) != 0x80) {
      return {0, 0};
    }
    code = (code << 6) | (ByteAt(text, i) & 0x3F);
  }
  const bool surrogate = code >= 0xD800 && code <= 0xDFFF;
  if (code < kSmallest[length] || code > 0x10FFFF || surrogate) {
    return {0, 0};
  }
  return {length, code};
}

bool IsSafe(char32_t code) {
  struct Range {
    char32_t first;
    char32_t last;
  };
  static constexpr Range kUnsafe[] = {
      {0x00, 0x1F},      // control characters, the escape character among them
      {0x7F, 0x9F},      // and the second set of them
      {0xAD, 0xAD},      // a hyphen that is not seen
      {0x034F, 0x034F},  // a joiner of letters
      {0x061C, 0x061C},  // the Arabic mark of the direction of writing
      {0x115F, 0x1160},  // fillers in place of letters, here and below
      {0x17B4, 0x17B5},  // vowels that are not seen
      {0x180B, 0x180F},  // Mongolian variants, and a vowel separator
      {0x200B, 0x200F},  // spaces and joiners without width, marks of the direction of writing
      {0x2028, 0x202E},  // separators of lines and paragraphs, embeddings and overrides
      {0x2060, 0x206F},  // more of the same, and isolates
      {0x3164, 0x3164},
      {0xFEFF, 0xFEFF},  // a space without width, or the mark of the order of bytes
      {0xFFA0, 0xFFA0},
      {0xFFF0, 0xFFFB},    // annotations
      {0xE0000, 0xE0FFF},  // tags, and variants beyond the first sixteen
  };
  return std::none_of(std::begin(kUnsafe), std::end(kUnsafe),
                      [=](const Range& r) { return code >= r.first && code <= r.last; });
}

std::string EscapedByte(unsigned int byte) {
  char text[8];
  snprintf(text, sizeof(text), "\\x%02x", byte);
  return text;
}

std::string EscapedCharacter(unsigned int code) {
  char text[16];
  snprintf(text, sizeof(text), "\\u{%x}", code);
  return text;
}

}  // namespace

std::string Printable(std::string_view text, std::string_view keep) {
  std::string safe;
  safe.reserve(text.size());
  while (!text.empty()) {
    const Character character = FirstCharacter(text);
    const size_t length = std::max<size_t>(character.length, 1);
    const bool ascii = character.length == 1;
    if (character.length > 0 &&
        (IsSafe(character.code) || (ascii && keep.find(text[0]) != keep.npos))) {
      safe += text.substr(0, length);
    } else if (length == 1) {
      safe += EscapedByte(ByteAt(text, 0));
    } else {
      safe += EscapedCharacter(character.code);
    }
    text.remove_prefix(length);
  }
  return safe;
}

}  // namespace quendelctl
