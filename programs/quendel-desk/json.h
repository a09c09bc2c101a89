// JSON texts.
#ifndef QUENDEL_DESK_JSON_H_
#define QUENDEL_DESK_JSON_H_

#include <json/value.h>

#include <string>

namespace quendeldesk {

// Reads a text that must be one JSON value and nothing else. Returns false when it is not.
bool ReadJson(const std::string& text, Json::Value& value);

// Gives the compact text of a value, in ASCII.
std::string JsonText(const Json::Value& value);

// Returns a member as a text, empty unless it is one.
std::string TextMember(const Json::Value& object, const char* name);

// Returns the text with everything that is not UTF-8 replaced.
std::string ValidUtf8(const std::string& text);
bool IsUtf8(const std::string& text);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_JSON_H_
