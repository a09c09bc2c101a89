// Readers for the arguments that several commands share.
#include "arguments.h"

#include <json/reader.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <memory>

namespace quendelctl {
namespace {

[[noreturn]] void FailToRead(const std::string& argument, const std::string& name) {
  throw CLI::ValidationError(argument, "cannot read " + name + ": " + strerror(errno));
}

std::string ReadWhole(const std::string& argument, FILE* file, const std::string& name,
                      size_t mostBytes) {
  std::string text;
  char chunk[4096];
  size_t got = 0;
  while ((got = fread(chunk, 1, sizeof(chunk), file)) > 0) {
    text.append(chunk, got);
    if (text.size() > mostBytes) {
      throw CLI::ValidationError(argument,
                                 name + " is longer than " + std::to_string(mostBytes) + " bytes");
    }
  }
  if (ferror(file) != 0) {
    FailToRead(argument, name);
  }
  return text;
}

template <typename Number>
bool IsWholly(const std::string& text, Number& number) {
  const char* end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number);
  return error == std::errc() && stop == end;
}

bool ParseStrictly(const std::string& json, Json::Value& value, std::string& errors) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  try {
    return reader->parse(json.data(), json.data() + json.size(), &value, &errors);
  } catch (const Json::Exception&) {  // the only thing that it is thrown for
    errors = "nested deeper than " + builder["stackLimit"].asString() + " levels";
    return false;
  }
}

}  // namespace

int ReadNumber(const std::string& argument, const std::string& text) {
  int number = 0;
  if (!IsWholly(text, number)) {
    throw CLI::ValidationError(argument, text + " is not a whole number that fits 32 bits");
  }
  return number;
}

int64_t ReadMoment(const std::string& argument, const std::string& text) {
  int64_t seconds = 0;
  if (!IsWholly(text, seconds) || seconds < 0) {
    throw CLI::ValidationError(argument, text + " is not a number of seconds since the epoch");
  }
  return seconds;
}

std::string ReadText(const std::string& argument, const std::string& name, size_t mostBytes) {
  if (name == "-") {
    return ReadWhole(argument, stdin, "the standard input", mostBytes);
  }
  const std::unique_ptr<FILE, int (*)(FILE*)> file(fopen(name.c_str(), "rbe"), fclose);
  if (file == nullptr) {
    FailToRead(argument, name);
  }
  return ReadWhole(argument, file.get(), name, mostBytes);
}

Json::Value ReadJson(const std::string& argument, const std::string& text) {
  constexpr size_t kMostBytes = 64 << 20;
  const std::string json = text.rfind('{', 0) == 0 ? text : ReadText(argument, text, kMostBytes);
  Json::Value value;
  std::string errors;
  if (!ParseStrictly(json, value, errors)) {
    errors.erase(errors.find_last_not_of('\n') + 1);
    std::replace(errors.begin(), errors.end(), '\n', ' ');
    throw CLI::ValidationError(argument, "not JSON: " + errors);
  }
  return value;
}

}  // namespace quendelctl
