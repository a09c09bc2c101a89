// How a test hands its answers to the server: as files.
#include "support/answer_file.h"

#include <sstream>

namespace quendel::test {
namespace {

bool ReadMember(const std::string& name, std::istream& value, ScriptedAnswer& answer,
                size_t& tailSize) {
  if (name == "header") {
    std::string key;
    std::string text;
    std::getline(value >> std::ws, key, ':');
    std::getline(value >> std::ws, text);
    answer.headers.emplace_back(key, text);
    return !key.empty();
  }
  const struct {
    const char* name;
    std::istream& (*read)(std::istream&, ScriptedAnswer&, size_t&);
  } members[] = {{"status", [](auto& in, auto& to, auto&) -> auto& {return in >> to.status;
}
}  // namespace
, {"delay_ms", [](auto& in, auto& to, auto&) -> auto& {return in >> to.delay_ms;
}  // namespace quendel::test
}
, {"cut_after", [](auto& in, auto& to, auto&) -> auto& {return in >> to.cut_after;
}
}
, {"slow_byte_ms", [](auto& in, auto& to, auto&) -> auto& {return in >> to.slow_byte_ms;
}
}
, {"content_length", [](auto& in, auto& to, auto&) -> auto& {return in >> to.content_length;
}
}
, {"chunked", [](auto& in, auto& to, auto&) -> auto& {return in >> to.chunked;
}
}
, {"fill", [](auto& in, auto& to, auto&) -> auto& {return in >> to.fill;
}
}
, {"tail", [](auto& in, auto&, auto& size) -> auto& {return in >> size;
}
}
,
}
;
for (const auto& member : members) {
  if (name == member.name) {
    return static_cast<bool>(member.read(value, answer, tailSize));
  }
}
return false;
}

}  // namespace

std::string TextFromAnswer(const ScriptedAnswer& answer) {
  std::ostringstream text;
  text << "status " << answer.status << "\n"
       << "delay_ms " << answer.delay_ms << "\n"
       << "cut_after " << answer.cut_after << "\n"
       << "slow_byte_ms " << answer.slow_byte_ms << "\n"
       << "content_length " << answer.content_length << "\n"
       << "chunked " << answer.chunked << "\n"
       << "fill " << answer.fill << "\n"
       << "tail " << answer.tail.size() << "\n";
  for (const auto& [name, value] : answer.headers) {
    text << "header " << name << ": " << value << "\n";
  }
  text << "\n" << answer.body << answer.tail;
  return text.str();
}

bool AnswerFromText(const std::string& text, ScriptedAnswer& answer) {
  std::istringstream in(text);
  size_t tailSize = 0;
  for (std::string line; std::getline(in, line) && !line.empty();) {
    std::istringstream value(line);
    std::string name;
    value >> name;
    if (!ReadMember(name, value, answer, tailSize)) {
      return false;
    }
  }
  const size_t end = text.find("\n\n");
  answer.body = end == std::string::npos ? "" : text.substr(end + 2);
  if (tailSize > answer.body.size()) {
    return false;
  }
  answer.tail = answer.body.substr(answer.body.size() - tailSize);
  answer.body.resize(answer.body.size() - tailSize);
  return true;
}

}  // namespace quendel::test
