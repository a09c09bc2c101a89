// The grammar of key-value files.
//
// A line is `key=value`. A blank line, a line whose first non-blank is `#` or `;`, one without `=`
// or without a key, and a `[section]` line are no pairs; they are kept as they are. Blanks (spaces
// and tabs) around key and value, and one CR at the end of the line, belong to neither.
//
// A value is raw, as it stands to the end of the line, unless it begins and ends with `"` and has
// something between: then it is the text between, with \" \\ \n \r \t decoded. So `""` is a value
// of two characters. A value ends at its first NUL, which no C text can hold.
#ifndef PLATFORM_STANDALONE_KEY_VALUE_TEXT_H_
#define PLATFORM_STANDALONE_KEY_VALUE_TEXT_H_

#include <string>
#include <string_view>

namespace platform {

// One line of a file. `text` is without its line end, which is LF or CR LF.
struct Line {
  std::string_view text;
  size_t begin;   // where the line begins in the file
  size_t end;     // where the next one begins
  bool complete;  // false for a last line that has no line end
};

// Walks over the lines of a file's text, which must outlive the walk.
class Lines {
 public:
  explicit Lines(std::string_view text) : text_(text), next_(0) {}

  // Returns false at the end.
  bool Next(Line& line);

 private:
  std::string_view text_;
  size_t next_;
};

// A line's key and value, as they are written there.
struct WrittenPair {
  std::string_view key;
  std::string_view value;
};

// Returns false for a line that is no pair.
bool ParsePair(std::string_view line, WrittenPair& pair);

// Takes the name of a section line: all between its first `[` and its last `]`. Returns false for
// any other line.
bool ParseSectionName(std::string_view line, std::string_view& name);

// Finds the last line with a key, the one that counts. Returns false when there is none. What
// `pair` gets lies inside `text`.
bool FindPair(std::string_view text, std::string_view key, WrittenPair& pair);

// Returns what a written value means, and how to write a value so that it is read back the same.
std::string DecodeValue(std::string_view written);
std::string EncodeValue(std::string_view value);

// Tells whether a key can be written so that it is read back the same.
bool IsWritableKey(std::string_view key);

}  // namespace platform

#endif  // PLATFORM_STANDALONE_KEY_VALUE_TEXT_H_
