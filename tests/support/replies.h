// Replies that a server which nobody authenticated may send. Every function that posts is run
// through all of them.
#ifndef TESTS_SUPPORT_REPLIES_H_
#define TESTS_SUPPORT_REPLIES_H_

#include <ostream>
#include <string>
#include <vector>

#include "support/scripted_answer.h"

namespace quendel::test {

struct HostileReply {
  std::string name;  // upper camel case, fit for the name of a test
  ScriptedAnswer answer;
  bool parses;   // is JSON, as the library's reader sees it
  bool success;  // says that the request succeeded; never when it is not JSON
};

void PrintTo(const HostileReply& reply, std::ostream* out);

// All of them come with status 200.
const std::vector<HostileReply>& HostileReplies();

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_REPLIES_H_
