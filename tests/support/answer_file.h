// How a test hands its answers to the server: as files.
#ifndef TESTS_SUPPORT_ANSWER_FILE_H_
#define TESTS_SUPPORT_ANSWER_FILE_H_

#include <string>

#include "support/scripted_answer.h"

namespace quendel::test {

// Where the server looks for answers and leaves requests unless it is told otherwise.
constexpr char kServerFolder[] = "/run/test-server";

// The text of an answer file: a line for each member that matters ("status 500", "delay_ms 20",
// "header Name: value"), an empty line, the body. `tail` is cut off the body's end: "tail 3" makes
// its last three bytes the tail.
std::string TextFromAnswer(const ScriptedAnswer& answer);

// Reads one. Returns false for a text that is not an answer.
bool AnswerFromText(const std::string& text, ScriptedAnswer& answer);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_ANSWER_FILE_H_
