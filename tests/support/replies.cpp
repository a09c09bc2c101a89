// Replies that a server which nobody authenticated may send.
#include "support/replies.h"

namespace quendel::test {
namespace {

using std::string_literals::operator""s;

// What a reply gives.
enum Verdict { kNotJson, kRefusal, kSuccess };

HostileReply Reply(const std::string& name, Verdict verdict, const ScriptedAnswer& answer) {
  return {name, answer, verdict != kNotJson, verdict == kSuccess};
}

HostileReply Reply(const std::string& name, Verdict verdict, const std::string& body) {
  ScriptedAnswer answer;
  answer.body = body;
  return Reply(name, verdict, answer);
}

// A hundred megabytes between two texts.
HostileReply HugeReply(const std::string& name, Verdict verdict, const std::string& body,
                       const std::string& tail) {
  ScriptedAnswer answer;
  answer.body = body;
  answer.fill = 100'000'000;
  answer.tail = tail;
  return Reply(name, verdict, answer);
}

std::string Nested(size_t levels) {
  return std::string(levels, '[') + std::string(levels, ']');
}

using Replies = std::vector<HostileReply>;

// "success" is asked of an object only.
Replies OtherKindsOfValue() {
  return {
      Reply("EmptyArray", kRefusal, "[]"),
      Reply("ArrayOfTheAnswer", kRefusal, R"([{"success":true}])"),
      Reply("Text", kRefusal, R"("x")"),
      Reply("Number", kRefusal, "12"),
      Reply("Null", kRefusal, "null"),
      Reply("True", kRefusal, "true"),
      Reply("EmptyObject", kRefusal, "{}"),
  };
}

// Numbers and null are converted, as they have a truth value; texts, arrays and objects have none.
Replies OtherKindsOfSuccess() {
  return {
      Reply("SuccessIsAText", kRefusal, R"({"success":"true"})"),
      Reply("SuccessIsAnEmptyText", kRefusal, R"({"success":""})"),
      Reply("SuccessIsAnArray", kRefusal, R"({"success":[]})"),
      Reply("SuccessIsAnObject", kRefusal, R"({"success":{}})"),
      Reply("SuccessIsAnObjectWithTheAnswer", kRefusal, R"({"success":{"success":true}})"),
      Reply("SuccessIsNull", kRefusal, R"({"success":null})"),
      Reply("SuccessIsZero", kRefusal, R"({"success":0})"),
      Reply("SuccessIsOne", kSuccess, R"({"success":1})"),
      Reply("SuccessIsNegative", kSuccess, R"({"success":-1})"),
      Reply("SuccessIsAFraction", kSuccess, R"({"success":0.5})"),
      Reply("SuccessIsBeyondAnyInteger", kSuccess, R"({"success":99999999999999999999})"),
      Reply("SuccessIsBeyondAnyNumber", kNotJson, R"({"success":1e999})"),
      Reply("SuccessIsInAnotherCase", kRefusal, R"({"Success":true})"),
      Reply("SuccessGoesOnAfterANulByte", kRefusal, R"({"success\u0000":true})"),
      Reply("SuccessTwiceTrueLast", kSuccess, R"({"success":false,"success":true})"),
      Reply("SuccessTwiceFalseLast", kRefusal, R"({"success":true,"success":false})"),
      Reply("FailureWithACodeBeyondAnyInteger", kRefusal,
            R"({"success":false,"code":99999999999999999999})"),
      Reply("FailureWithATextForACode", kRefusal, R"({"success":false,"code":"111000"})"),
      Reply("SuccessWithAnObjectForACode", kSuccess, R"({"success":true,"code":{"a":[]}})"),
  };
}

// The reader takes comments and stops at the value's end; it is strict about the value itself.
Replies OddTexts() {
  return {
      Reply("Empty", kNotJson, ""),
      Reply("Blanks", kNotJson, " \t\r\n"),
      Reply("Html", kNotJson, "<html><body>Gateway timeout</body></html>"),
      Reply("CutShort", kNotJson, R"({"success":tru)"),
      Reply("WithoutTheEnd", kNotJson, R"({"success":true)"),
      Reply("TrailingComma", kNotJson, R"({"success":true,})"),
      Reply("SingleQuotes", kNotJson, "{'success':true}"),
      Reply("WithoutQuotes", kNotJson, "{success:true}"),
      Reply("NotANumber", kNotJson, R"({"success":NaN})"),
      Reply("ByteOrderMark", kNotJson, "\xEF\xBB\xBF{\"success\":true}"),
      Reply("Utf16", kNotJson, "{\0\"\0s\0\"\0:\0001\0}\0"s),
      Reply("NulBefore", kNotJson, "\0{\"success\":true}"s),
      Reply("NulInside", kNotJson, "{\"success\":\0true}"s),
      Reply("NulInAText", kSuccess, "{\"success\":true,\"m\":\"a\0b\"}"s),
      Reply("NulBehind", kSuccess, "{\"success\":true}\0\0\0"s),
      Reply("NulEscaped", kSuccess, R"({"success":true,"m":"a\u0000b"})"),
      Reply("TextBehind", kSuccess, R"({"success":true} trailing)"),
      Reply("RefusalBehind", kSuccess, R"({"success":true}{"success":false})"),
      Reply("Comments", kSuccess, "// a\n{/* b */\"success\":true}"),
      Reply("NotUtf8InAText", kSuccess, "{\"success\":true,\"m\":\"\xff\xfe\xc0\x80\"}"),
      Reply("NotUtf8InAName", kSuccess, "{\"\xff\":1,\"success\":true}"),
      Reply("NotUtf8Behind", kSuccess, "{\"success\":true}\xff"),
      Reply("HalfASurrogate", kNotJson, R"({"success":true,"m":"\ud800"})"),
      Reply("FormatDirectives", kNotJson, "%s%n%s%n%d"),
      Reply("FormatDirectivesInAText", kRefusal, R"({"success":false,"m":"%s%n%s%n%d"})"),
  };
}

Replies DeepAndLongOnes() {
  return {
      Reply("NestedAThousandLevels", kRefusal, Nested(1000)),
      Reply("NestedAThousandAndOneLevels", kNotJson, Nested(1001)),
      Reply("SuccessBesideAThousandLevels", kSuccess,
            R"({"success":true,"n":)" + Nested(999) + "}"),
      Reply("SuccessBesideAThousandAndOneLevels", kNotJson,
            R"({"success":true,"n":)" + Nested(1000) + "}"),
      Reply("NestedWithoutEnd", kNotJson, std::string(1'000'000, '[')),
      HugeReply("HugeText", kRefusal, "\"", "\""),
      HugeReply("HugeMember", kSuccess, R"({"m":")", R"(","success":true})"),
      HugeReply("HugeTail", kSuccess, R"({"success":true})", ""),
      HugeReply("HugeNonsense", kNotJson, "", ""),
  };
}

Replies Joined(std::vector<Replies> lists) {
  Replies all;
  for (const Replies& list : lists) {
    all.insert(all.end(), list.begin(), list.end());
  }
  return all;
}

}  // namespace

void PrintTo(const HostileReply& reply, std::ostream* out) {
  *out << reply.name;
}

const std::vector<HostileReply>& HostileReplies() {
  static const Replies replies =
      Joined({OtherKindsOfValue(), OtherKindsOfSuccess(), OddTexts(), DeepAndLongOnes()});
  return replies;
}

}  // namespace quendel::test
