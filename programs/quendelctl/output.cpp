// What the program writes to the standard output.
#include "output.h"

#include <json/writer.h>
#include <unistd.h>

#include <cerrno>
#include <sstream>
#include <system_error>

#include "printable.h"

namespace quendelctl {
namespace {

std::string JsonText(const Json::Value& value, bool utf8, const char* indentation = "") {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = indentation;
  builder["emitUTF8"] = utf8;
  return Json::writeString(builder, value);
}

// Without UTF-8 JsonCpp escapes every character that does not print, but for this one.
std::string AsciiJson(const Json::Value& value, const char* indentation = "") {
  constexpr char kDelete = '\x7f';
  std::string text = JsonText(value, false, indentation);
  for (size_t at = text.find(kDelete); at != text.npos; at = text.find(kDelete, at)) {
    text.replace(at, 1, "\\u007f");
  }
  return text;
}

void AddFailure(const Result& result, Json::Value& object) {
  object["reason"] = result.reason;
  if (!object.isMember("error")) {
    object["error"] = result.lines.empty() ? "It failed." : result.lines[0];
  }
}

}  // namespace

void PrintResult(const Result& result, bool json) {
  PrintText(result.text);
  if (json && result.text.empty()) {
    Json::Value object = result.members;
    object["success"] = result.success;
    if (!result.success) {
      AddFailure(result, object);
    }
    PrintText(AsciiJson(object) + "\n");
    return;
  }
  for (const std::string& line : result.lines) {
    PrintText(Printable(line) + "\n");
  }
  PrintText(isatty(STDOUT_FILENO) != 0 ? Printable(result.bytes, "\n\t") : result.bytes);
}

void PrintText(std::string_view text) {
  while (!text.empty()) {
    const ssize_t written = write(STDOUT_FILENO, text.data(), text.size());
    if (written >= 0) {
      text.remove_prefix(static_cast<size_t>(written));
    } else if (errno != EINTR) {
      throw std::system_error(errno, std::generic_category(), "cannot write the output");
    }
  }
}

std::string JsonForReader(const Json::Value& value) {
  return JsonText(value, true);
}

std::vector<std::string> JsonLines(const Json::Value& value) {
  std::vector<std::string> lines;
  std::istringstream text(AsciiJson(value, "  "));
  for (std::string line; std::getline(text, line);) {
    lines.push_back(line);
  }
  return lines;
}

}  // namespace quendelctl
