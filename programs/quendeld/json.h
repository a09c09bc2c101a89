// JSON as it comes from a worker, a file, the control socket or, through a worker, from the server:
// nothing about its form is taken for granted, and none of these throws for it.
#ifndef QUENDELD_JSON_H_
#define QUENDELD_JSON_H_

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>

namespace quendeld {

// Reads a text that is one JSON value. Returns nothing for any other text.
std::optional<Json::Value> JsonFromText(const std::string& text);

// Returns the value's JSON text on one line, without a line end.
std::string JsonLine(const Json::Value& value);

// Each of these reads a member of an object. What is no object, lacks the member or has one of
// another kind reads as null, an empty text, false or nothing.
const Json::Value& Member(const Json::Value& object, const char* key);
std::string TextOf(const Json::Value& object, const char* key);
bool BoolOf(const Json::Value& object, const char* key);
std::optional<int64_t> NumberOf(const Json::Value& object, const char* key);

}  // namespace quendeld

#endif  // QUENDELD_JSON_H_
