// JSON values from and to text, and members read without a throw.
#include "base/json_text.h"

#include <json/reader.h>
#include <json/writer.h>

#include <cstring>
#include <new>

namespace quendel {

bool JsonFromText(const std::string& text, Json::Value& value) {
  try {
    Json::Value parsed;
    if (!Json::Reader().parse(text, parsed)) {
      return false;
    }
    value.swap(parsed);
    return true;
  } catch (const std::bad_alloc&) {
    throw;
  } catch (...) {
    return false;  // nested too deeply
  }
}

std::string JsonToText(const Json::Value& value) {
  Json::FastWriter writer;
  writer.omitEndingLineFeed();
  return writer.write(value);
}

const Json::Value* JsonMember(const Json::Value& object, const char* key) {
  return object.isObject() ? object.find(key, key + strlen(key)) : nullptr;
}

bool JsonBool(const Json::Value& object, const char* key) {
  const Json::Value* member = JsonMember(object, key);
  return member != nullptr && member->isConvertibleTo(Json::booleanValue) && member->asBool();
}

int JsonInt(const Json::Value& object, const char* key) {
  const Json::Value* member = JsonMember(object, key);
  return member != nullptr && member->isConvertibleTo(Json::intValue) ? member->asInt() : 0;
}

std::string JsonText(const Json::Value& object, const char* key) {
  const Json::Value* member = JsonMember(object, key);
  return member != nullptr && member->isConvertibleTo(Json::stringValue) ? member->asString()
                                                                         : std::string();
}

}  // namespace quendel
