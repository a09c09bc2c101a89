// Takes a multipart/form-data body apart while it arrives.
#include "multipart.h"

#include <strings.h>

#include <algorithm>

namespace quendeldesk {
namespace {

constexpr size_t kMostHeadBytes = 8192;
constexpr size_t kMostBlanks = 64;  // behind a boundary
constexpr size_t kMostBoundary = 200;

bool StartsWithIgnoringCase(std::string_view text, std::string_view start) {
  return text.size() >= start.size() && strncasecmp(text.data(), start.data(), start.size()) == 0;
}

std::string_view Trimmed(std::string_view text) {
  const size_t first = text.find_first_not_of(" \t");
  if (first == std::string_view::npos) {
    return {};
  }
  return text.substr(first, text.find_last_not_of(" \t") - first + 1);
}

// The three characters that whoever writes a form puts in as %22, %0D and %0A.
void DecodeQuote(std::string& text) {
  const struct {
    const char* code;
    char character;
  } codes[] = {{"%22", '"'}, {"%0D", '\r'}, {"%0A", '\n'}};
  for (const auto& [code, character] : codes) {
    for (size_t at = text.find(code); at != text.npos; at = text.find(code, at + 1)) {
      text.replace(at, 3, 1, character);
    }
  }
}

// Takes a value, which may be quoted, off the front of the text.
std::string TakeValue(std::string_view& text) {
  std::string value;
  if (text.empty() || text.front() != '"') {
    const size_t end = std::min(text.find(';'), text.size());
    value = Trimmed(text.substr(0, end));
    text.remove_prefix(end);
    return value;
  }
  size_t i = 1;
  for (; i < text.size() && text[i] != '"'; ++i) {
    const bool escape = text[i] == '\\' && i + 1 < text.size();
    i += escape && (text[i + 1] == '"' || text[i + 1] == '\\') ? 1 : 0;
    value += text[i];
  }
  text.remove_prefix(std::min(i + 1, text.size()));
  DecodeQuote(value);
  return value;
}

// Returns the value of a parameter of a header such as: form-data; name="a"; filename="b"
std::optional<std::string> Parameter(std::string_view header, std::string_view name) {
  size_t semicolon = header.find(';');
  while (semicolon != std::string_view::npos) {
    header.remove_prefix(semicolon + 1);
    const size_t equals = header.find('=');
    if (equals == std::string_view::npos) {
      return std::nullopt;
    }
    const std::string_view key = Trimmed(header.substr(0, equals));
    header.remove_prefix(equals + 1);
    header.remove_prefix(std::min(header.find_first_not_of(" \t"), header.size()));
    const std::string value = TakeValue(header);
    if (key.size() == name.size() && StartsWithIgnoringCase(key, name)) {
      return value;
    }
    semicolon = header.find(';');
  }
  return std::nullopt;
}

void ReadHeadLine(std::string_view line, PartHead& head, bool& isForm) {
  constexpr std::string_view kDisposition = "content-disposition:";
  constexpr std::string_view kType = "content-type:";
  if (StartsWithIgnoringCase(line, kDisposition)) {
    line.remove_prefix(kDisposition.size());
    isForm = StartsWithIgnoringCase(Trimmed(line), "form-data");
    head.name = Parameter(line, "name").value_or("");
    head.filename = Parameter(line, "filename");
  } else if (StartsWithIgnoringCase(line, kType)) {
    head.content_type = Trimmed(line.substr(kType.size()));
  }
}

}  // namespace

// The first boundary may stand at the very beginning: an imagined line end before it makes it like
// the others.
MultipartReader::MultipartReader(const std::string& boundary, PartSink& sink)
    : delimiter_("\r\n--" + boundary), sink_(sink), buffer_("\r\n") {
}

bool MultipartReader::Take(std::string_view bytes) {
  if (state_ == State::kBad || state_ == State::kComplete) {
    return state_ == State::kComplete;  // what follows the last boundary means nothing
  }
  buffer_.append(bytes);
  while (Step()) {
  }
  return state_ != State::kBad;
}

// Returns whether there may be more to do with the bytes at hand.
bool MultipartReader::Step() {
  switch (state_) {
    case State::kPreamble:
    case State::kBody:
      return FindBoundary();
    case State::kHead:
      return ReadHead();
    default:
      return false;
  }
}

// Hands on what is before the next boundary.
bool MultipartReader::FindBoundary() {
  size_t at = 0;
  for (;; ++at) {
    at = buffer_.find(delimiter_, at);
    if (at == buffer_.npos) {
      Emit(buffer_.size() - std::min(buffer_.size(), delimiter_.size() - 1));
      return false;
    }
    size_t size = 0;
    const Line line = LineAfter(at + delimiter_.size(), size);
    if (line == Line::kUnknown) {
      Emit(at);
      return false;
    }
    if (line != Line::kNone) {
      Emit(at);
      buffer_.erase(0, delimiter_.size() + size);
      if (state_ == State::kBody) {
        sink_.EndPart();
      }
      state_ = line == Line::kLast ? State::kComplete : State::kHead;
      return true;
    }
  }
}

// Looks at what follows a boundary: two dashes, or blanks and a line end; else it is none.
MultipartReader::Line MultipartReader::LineAfter(size_t at, size_t& size) const {
  const std::string_view rest = std::string_view(buffer_).substr(at);
  if (rest.substr(0, 2) == "--") {
    size = 2;
    return Line::kLast;
  }
  const size_t blanks = std::min(rest.find_first_not_of(" \t"), rest.size());
  if (blanks > kMostBlanks) {
    return Line::kNone;
  }
  const std::string_view end = rest.substr(blanks, 2);
  size = blanks + 2;
  if (end == "\r\n") {
    return Line::kNext;
  }
  const bool more = end.empty() || end == "\r" || (rest == "-");
  return more ? Line::kUnknown : Line::kNone;
}

void MultipartReader::Emit(size_t size) {
  if (state_ == State::kBody && size > 0) {
    sink_.PartBytes(std::string_view(buffer_).substr(0, size));
  }
  buffer_.erase(0, size);
}

bool MultipartReader::ReadHead() {
  const bool none = buffer_.compare(0, 2, "\r\n") == 0;
  const size_t end = none ? 0 : buffer_.find("\r\n\r\n");
  if (end == buffer_.npos || end > kMostHeadBytes) {
    state_ = end != buffer_.npos || buffer_.size() > kMostHeadBytes ? State::kBad : state_;
    return false;
  }
  PartHead head;
  bool isForm = false;
  for (size_t at = 0; at < end;) {
    const size_t lineEnd = std::min(buffer_.find("\r\n", at), end);
    ReadHeadLine(std::string_view(buffer_).substr(at, lineEnd - at), head, isForm);
    at = lineEnd + 2;
  }
  if (!isForm) {
    state_ = State::kBad;
    return false;
  }
  buffer_.erase(0, end + (none ? 2 : 4));
  sink_.BeginPart(head);
  state_ = State::kBody;
  return true;
}

std::string BoundaryOf(const std::string& contentType) {
  constexpr std::string_view kForm = "multipart/form-data";
  if (!StartsWithIgnoringCase(contentType, kForm)) {
    return "";
  }
  const std::string boundary = Parameter(contentType, "boundary").value_or("");
  return boundary.size() > kMostBoundary ? "" : boundary;
}

}  // namespace quendeldesk
