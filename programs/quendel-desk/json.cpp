// JSON texts.
#include "json.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>

namespace quendeldesk {
namespace {

constexpr int kMostLevels = 100;
constexpr char kReplacement[] = "\xEF\xBF\xBD";

// Returns the length of the UTF-8 character that begins here, 0 when none does.
size_t CharacterAt(const std::string& text, size_t at) {
  const auto byte = [&text](size_t i) {
    return i < text.size() ? static_cast<unsigned char>(text[i]) : 0U;
  };
  const unsigned first = byte(at);
  if (first < 0x80) {
    return 1;
  }
  const size_t size = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4) {
    return 0;
  }
  for (size_t i = 1; i < size; ++i) {
    if ((byte(at + i) & 0xC0) != 0x80) {
      return 0;
    }
  }
  const unsigned second = byte(at + 1);
  const bool overlong = (first == 0xE0 && second < 0xA0) || (first == 0xF0 && second < 0x90);
  const bool outside = (first == 0xED && second > 0x9F) || (first == 0xF4 && second > 0x8F);
  return overlong || outside ? 0 : size;
}

}  // namespace

bool ReadJson(const std::string& text, Json::Value& value) {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["allowComments"] = false;
  builder["failIfExtra"] = true;
  builder["stackLimit"] = kMostLevels;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  try {
    Json::Value read;
    if (!reader->parse(text.data(), text.data() + text.size(), &read, nullptr)) {
      return false;
    }
    value = std::move(read);
    return true;
  } catch (const std::exception&) {
    return false;  // nested too deeply
  }
}

std::string JsonText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

std::string TextMember(const Json::Value& object, const char* name) {
  const Json::Value* member =
      object.isObject() ? object.find(name, name + std::char_traits<char>::length(name)) : nullptr;
  return member != nullptr && member->isString() ? member->asString() : "";
}

std::string ValidUtf8(const std::string& text) {
  std::string valid;
  for (size_t at = 0; at < text.size();) {
    const size_t size = CharacterAt(text, at);
    valid.append(size == 0 ? kReplacement : text.substr(at, size));
    at += size == 0 ? 1 : size;
  }
  return valid;
}

bool IsUtf8(const std::string& text) {
  for (size_t at = 0; at < text.size();) {
    const size_t size = CharacterAt(text, at);
    if (size == 0) {
      return false;
    }
    at += size;
  }
  return true;
}

}  // namespace quendeldesk
