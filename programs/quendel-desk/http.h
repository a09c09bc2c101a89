// A request, its answer, and the server between them.
#ifndef QUENDEL_DESK_HTTP_H_
#define QUENDEL_DESK_HTTP_H_

#include <sys/socket.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "connection_table.h"
#include "crypto.h"
#include "descriptor.h"

namespace quendeldesk {

struct RequestHead {
  std::string method;
  std::string target;   // as it was sent: nothing in it is decoded
  std::string address;  // by which its sender is counted
  std::optional<uint64_t> length;
  std::function<std::string(const char* name)> header;  // empty when there is none
};

// Makes the bytes of a body that is not known beforehand. Returns how many it wrote, 0 at the end;
// throws when the rest cannot be made.
using BodySource = std::function<size_t(char* buffer, size_t size)>;

struct Answer {
  unsigned status = 200;
  std::string body = {};
  std::string type = "application/json";
  std::vector<std::pair<std::string, std::string>> headers = {};
  Descriptor file = {};         // instead of the body: the whole of it
  BodySource source = nullptr;  // instead of the body
  int code = 0;                 // of a refusal, for the access log
  std::string note = {};        // likewise
};

// One request. When it goes away without having been asked to finish, it was cut.
class Exchange {
 public:
  using Reply = std::function<void(Answer)>;

  virtual ~Exchange() = default;
  // Takes bytes of the body. It must not wait for anything but a file's bytes.
  virtual void Take(std::string_view bytes) = 0;
  // The body is whole. `reply` is to be called once, now or later, on any thread.
  virtual void Finish(Reply reply) = 0;
};

class Service {
 public:
  virtual ~Service() = default;
  virtual std::unique_ptr<Exchange> Begin(const RequestHead& head) = 0;
};

struct HttpLimits {
  std::chrono::seconds head_time{20};  // from the connection, or the last answer, to a whole head
  std::chrono::seconds more_time{30};  // how long no byte may come
  uint64_t least_rate = 1024;          // bytes a second that a body must bring after that
  std::chrono::seconds answer_time{60};
};

// Serves the connections that it is handed, in threads of its own.
class HttpServer {
 public:
  // With an identity it speaks TLS.
  HttpServer(Service& service, ConnectionTable& table, const HttpLimits& limits, unsigned threads,
             const Identity* identity);
  ~HttpServer();

  void Take(int descriptor, const sockaddr* address, socklen_t size);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_HTTP_H_
