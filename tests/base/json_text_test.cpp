// JSON that comes from outside is read without a throw, whatever it is.
#include "base/json_text.h"

#include <gmock/gmock.h>

using namespace quendel;

namespace {

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(JsonFromText(text, value)) << text;
  return value;
}

std::string Nested(size_t depth) {
  return std::string(depth, '[') + std::string(depth, ']');
}

}  // namespace

TEST(JsonFromTextTest, TakesAnyKindOfValue) {
  for (const char* text : {"{}", "[]", "\"x\"", "12", "-1.5", "true", "null"}) {
    Json::Value value;
    EXPECT_TRUE(JsonFromText(text, value)) << text;
  }
}

TEST(JsonFromTextTest, AcceptsCommentsAndTextBehindTheValue) {
  EXPECT_EQ(Parsed("/* a */ {\"a\":1} // b\n more")["a"].asInt(), 1);
}

TEST(JsonFromTextTest, LeavesTheValueAloneWhenTheTextIsNoJson) {
  for (const char* text :
       {"", " ", "not json", "{\"a\":", "[1,]", "{\"a\":1,}", "\xEF\xBB\xBF{}"}) {
    Json::Value value = "before";
    EXPECT_FALSE(JsonFromText(text, value)) << text;
    EXPECT_EQ(value, Json::Value("before")) << text;
  }
}

TEST(JsonFromTextTest, RefusesNestingBeyondAThousandLevels) {
  Json::Value value = "before";
  EXPECT_TRUE(JsonFromText(Nested(999), value));
  value = "before";
  EXPECT_FALSE(JsonFromText(Nested(1001), value));
  EXPECT_EQ(value, Json::Value("before"));
  EXPECT_FALSE(JsonFromText(std::string(1 << 20, '['), value));
}

TEST(JsonFromTextTest, KeepsNulBytesInsideStrings) {
  EXPECT_EQ(Parsed("\"a\\u0000b\"").asString(), std::string("a\0b", 3));
}

TEST(JsonToTextTest, IsCompactAndHasNoLineEnd) {
  Json::Value value;
  value["a"].append(1);
  value["a"].append("x");
  EXPECT_EQ(JsonToText(value), R"({"a":[1,"x"]})");
  EXPECT_EQ(JsonToText(Json::Value()), "null");
  EXPECT_EQ(JsonToText(Json::Value(Json::arrayValue)), "[]");
}

TEST(JsonToTextTest, LeavesCommentsOut) {
  EXPECT_EQ(JsonToText(Parsed("// a\n{\"b\":/* c */1}")), R"({"b":1})");
}

TEST(JsonBoolTest, ConvertsWhatCanBeConverted) {
  const Json::Value object = Parsed(R"({"t":true,"f":false,"n":null,"one":1,"zero":0,"half":0.5})");
  EXPECT_TRUE(JsonBool(object, "t"));
  EXPECT_TRUE(JsonBool(object, "one"));
  EXPECT_TRUE(JsonBool(object, "half"));
  EXPECT_FALSE(JsonBool(object, "f"));
  EXPECT_FALSE(JsonBool(object, "zero"));
  EXPECT_FALSE(JsonBool(object, "n"));
}

TEST(JsonBoolTest, ReadsAnythingElseAsFalse) {
  const Json::Value object = Parsed(R"({"s":"true","a":[1],"o":{"x":1},"es":""})");
  for (const char* key : {"s", "a", "o", "es", "missing"}) {
    EXPECT_FALSE(JsonBool(object, key)) << key;
  }
  for (const char* text : {"[]", "\"x\"", "12", "null", "true"}) {
    EXPECT_FALSE(JsonBool(Parsed(text), "t")) << text;
  }
}

TEST(JsonIntTest, ConvertsWhatCanBeConverted) {
  const Json::Value object = Parsed(R"({"i":111000,"neg":-5,"real":7.9,"t":true,"n":null})");
  EXPECT_EQ(JsonInt(object, "i"), 111000);
  EXPECT_EQ(JsonInt(object, "neg"), -5);
  EXPECT_EQ(JsonInt(object, "real"), 7);
  EXPECT_EQ(JsonInt(object, "t"), 1);
  EXPECT_EQ(JsonInt(object, "n"), 0);
}

TEST(JsonIntTest, ReadsAnythingElseAsZero) {
  const Json::Value object =
      Parsed(R"({"big":99999999999999999999,"wide":2147483648,"s":"12","a":[1],"o":{},"e":1e300})");
  for (const char* key : {"big", "wide", "s", "a", "o", "e", "missing"}) {
    EXPECT_EQ(JsonInt(object, key), 0) << key;
  }
  EXPECT_EQ(JsonInt(Parsed("[5]"), "0"), 0);
}

TEST(JsonTextTest, ConvertsWhatCanBeConverted) {
  const Json::Value object = Parsed(R"({"s":"x","i":12,"t":true,"n":null})");
  EXPECT_EQ(JsonText(object, "s"), "x");
  EXPECT_EQ(JsonText(object, "i"), "12");
  EXPECT_EQ(JsonText(object, "t"), "true");
  EXPECT_EQ(JsonText(object, "n"), "");
}

TEST(JsonTextTest, ReadsAnythingElseAsAnEmptyText) {
  const Json::Value object = Parsed(R"({"a":["x"],"o":{"x":"y"}})");
  for (const char* key : {"a", "o", "missing"}) {
    EXPECT_EQ(JsonText(object, key), "") << key;
  }
  EXPECT_EQ(JsonText(Parsed("\"x\""), "s"), "");
}

TEST(JsonMemberTest, FindsAMemberThatIsNull) {
  const Json::Value object = Parsed(R"({"n":null})");
  ASSERT_NE(JsonMember(object, "n"), nullptr);
  EXPECT_TRUE(JsonMember(object, "n")->isNull());
  EXPECT_EQ(JsonMember(object, "m"), nullptr);
  EXPECT_EQ(JsonMember(Parsed("[1]"), "n"), nullptr);
}
