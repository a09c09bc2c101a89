// What the program writes to the standard output.
#include "output.h"

#include <json/writer.h>

#include <cerrno>
#include <cstdio>
#include <system_error>

#include "printable.h"

namespace quendelctl {
namespace {

std::string JsonLine(const Json::Value& value, bool utf8) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = utf8;
  return Json::writeString(builder, value);
}

// Without UTF-8 JsonCpp escapes every character that does not print, but for this one.
std::string AsciiJsonLine(const Json::Value& value) {
  constexpr char kDelete = '\x7f';
  std::string line = JsonLine(value, false);
  for (size_t at = line.find(kDelete); at != line.npos; at = line.find(kDelete, at)) {
    line.replace(at, 1, "\\u007f");
  }
  return line;
}

}  // namespace

void PrintResult(const Result& result, bool json) {
  if (json) {
    Json::Value object = result.members;
    object["success"] = result.success;
    PrintText(AsciiJsonLine(object) + "\n");
    return;
  }
  for (const std::string& line : result.lines) {
    PrintText(Printable(line) + "\n");
  }
}

void PrintText(const std::string& text) {
  fwrite(text.data(), 1, text.size(), stdout);  // FinishOutput() tells whether it got there
}

void FinishOutput() {
  errno = 0;
  const bool failed = fflush(stdout) != 0 || ferror(stdout) != 0;
  if (failed || fclose(stdout) != 0) {
    throw std::system_error(errno, std::generic_category(), "cannot write the output");
  }
}

std::string JsonForReader(const Json::Value& value) {
  return JsonLine(value, true);
}

}  // namespace quendelctl
