// The scripted HTTPS server on port 51790 of the test's appliance. It is a process of its own
// (test_server), so only tests that are registered with SERVER have it.
#ifndef SUPPORT_SERVER_H_
#define SUPPORT_SERVER_H_

#include <cstddef>
#include <string>
#include <utility>
#include <vector>

namespace quendel::test {

using Headers = std::vector<std::pair<std::string, std::string>>;

// What the server answers to one request, and how badly it behaves.
struct ScriptedAnswer {
  int status = 200;
  std::string body = {};
  Headers headers = {};  // after the server's own: Content-Length or Transfer-Encoding, Connection
  int delay_ms = 0;      // before the first byte
  long cut_after = -1;   // closes without a farewell after so many bytes of the whole answer
  int slow_byte_ms = 0;  // a pause after each byte
  long content_length = -1;  // claimed instead of the true one
  bool chunked = false;
  size_t fill = 0;        // so many letters x follow the body; they are made while they are sent
  std::string tail = {};  // follows the fill
};

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

// Returns the files that hold their bytes, for requests that are too large to be read into memory.
std::vector<std::string> RequestFiles();

// Shows this certificate from the next connection on: "self-signed" (which it starts with),
// "expired" or "wrong-host". All of them are self-signed.
void UseCertificate(const std::string& kind);

}  // namespace quendel::test

#endif  // SUPPORT_SERVER_H_
