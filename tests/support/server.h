// The scripted HTTPS server on port 51790 of the test's appliance. It is a process of its own
// (test_server), so only tests that are registered with SERVER have it.
#ifndef TESTS_SUPPORT_SERVER_H_
#define TESTS_SUPPORT_SERVER_H_

#include <string>
#include <vector>

#include "support/json.h"
#include "support/scripted_answer.h"

namespace quendel::test {

// Queues an answer: each is given once, in this order. With none queued the server answers 200 with
// the body {"success":true}.
void Answer(const ScriptedAnswer& answer);

// A request as it arrived.
struct Request {
  std::string line;  // "POST /heartbeat/S1 HTTP/1.1"
  Headers headers;   // in their order
  std::string body;  // without the framing of chunks
  std::string raw;   // every byte
};

// Returns the requests that arrived whole, in the order in which their connections were opened.
std::vector<Request> Requests();

// Returns the first line of each, and of the only one so far.
std::vector<std::string> RequestLines();
std::string RequestLine();

// Returns the files that hold their bytes, for requests that are too large to be read into memory.
std::vector<std::string> RequestFiles();

// Shows this certificate from the next connection on: "self-signed" (which it starts with),
// "expired" or "wrong-host". All of them are self-signed.
void UseCertificate(const std::string& kind);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_SERVER_H_
