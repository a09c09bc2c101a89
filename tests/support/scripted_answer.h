// One answer of the scripted HTTPS server.
#ifndef TESTS_SUPPORT_SCRIPTED_ANSWER_H_
#define TESTS_SUPPORT_SCRIPTED_ANSWER_H_

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

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_SCRIPTED_ANSWER_H_
