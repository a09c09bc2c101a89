#include "json.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>

namespace quendeld {

std::optional<Json::Value> JsonFromText(const std::string& text) try {
  Json::CharReaderBuilder builder;
  builder["failIfExtra"] = true;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
    return std::nullopt;
  }
  return value;
} catch (const Json::Exception&) {  // nested too deep
  return std::nullopt;
}

std::string JsonLine(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

const Json::Value& Member(const Json::Value& object, const char* key) {
  return object.isObject() ? object[key] : Json::Value::nullSingleton();
}

std::string TextOf(const Json::Value& object, const char* key) {
  const Json::Value& member = Member(object, key);
  return member.isString() ? member.asString() : std::string();
}

bool BoolOf(const Json::Value& object, const char* key) {
  const Json::Value& member = Member(object, key);
  return member.isBool() && member.asBool();
}

std::optional<int64_t> NumberOf(const Json::Value& object, const char* key) {
  const Json::Value& member = Member(object, key);
  const bool isNumber = member.type() == Json::intValue || member.type() == Json::uintValue;
  return isNumber && member.isInt64() ? std::optional<int64_t>(member.asInt64()) : std::nullopt;
}

}  // namespace quendeld
