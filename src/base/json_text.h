// JSON values from and to text, and members read without a throw.
//
// JsonCpp throws where a value is not of the kind that a call expects. What the library reads comes
// from files and from a server that nobody authenticated, so it reads through these instead.
#ifndef BASE_JSON_TEXT_H_
#define BASE_JSON_TEXT_H_

#include <json/value.h>

#include <string>

namespace quendel {

// Parses a text of any kind of JSON value. Comments, and anything behind the value, are accepted.
// Returns false, with `value` untouched, for a text that is not JSON or nests deeper than 1,000.
// Throws only when memory runs out.
bool JsonFromText(const std::string& text, Json::Value& value);

// Returns the value's JSON text: compact, without a line end.
std::string JsonToText(const Json::Value& value);

// Each of these reads one member of an object. A value that is no object, a missing member and one
// of a kind that JsonCpp does not convert read as false, 0 or an empty text.
bool JsonBool(const Json::Value& object, const char* key);
int JsonInt(const Json::Value& object, const char* key);
std::string JsonText(const Json::Value& object, const char* key);

// Returns the member, or null when `object` is no object or lacks it.
const Json::Value* JsonMember(const Json::Value& object, const char* key);

}  // namespace quendel

#endif  // BASE_JSON_TEXT_H_
