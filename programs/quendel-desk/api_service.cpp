// Answers programs: who may ask, which question it is, and that none takes the desk down.
#include "api_service.h"

#include <optional>

#include "access_log.h"
#include "api_routes.h"
#include "json.h"

namespace quendeldesk {
namespace {

constexpr char kBase[] = "/api/v1";
constexpr size_t kMostBody = kMiB;
constexpr size_t kMostDigits = 18;

Answer ErrorAnswer(unsigned status, const std::string& message) {
  Json::Value body;
  body["error"] = message;
  Answer answer = JsonAnswer(body, status);
  answer.note = message;
  if (status == 401) {
    answer.headers = {{"WWW-Authenticate", "Bearer"}};
  }
  return answer;
}

// Nothing that a browser is handed here is a page, or may be kept by it.
void AddSafeHeaders(Answer& answer) {
  answer.headers.insert(answer.headers.end(), {{"X-Content-Type-Options", "nosniff"},
                                               {"Cache-Control", "no-store"},
                                               {"Content-Security-Policy", "default-src 'none'"}});
}

std::vector<std::string> Split(const std::string& text, char separator) {
  std::vector<std::string> pieces;
  size_t begin = 0;
  for (size_t end = 0; end != text.npos; begin = end + 1) {
    end = text.find(separator, begin);
    pieces.push_back(text.substr(begin, end - begin));
  }
  return pieces;
}

std::string Decoded(const std::string& text) {
  std::string decoded;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%' && i + 2 < text.size() && isxdigit(text[i + 1]) && isxdigit(text[i + 2])) {
      decoded += static_cast<char>(std::stoi(text.substr(i + 1, 2), nullptr, 16));
      i += 2;
    } else {
      decoded += text[i] == '+' ? ' ' : text[i];
    }
  }
  return decoded;
}

std::map<std::string, std::string> QueryOf(const std::string& text) {
  std::map<std::string, std::string> query;
  for (const std::string& pair : Split(text, '&')) {
    const size_t equals = std::min(pair.find('='), pair.size());
    query[Decoded(pair.substr(0, equals))] =
        equals < pair.size() ? ValidUtf8(Decoded(pair.substr(equals + 1))) : "";
  }
  return query;
}

// Compares a path with the pattern of a route, and takes the numbers out of it.
bool Matches(const std::string& pattern, const std::string& path, std::vector<long long>& numbers) {
  const std::vector<std::string> wanted = Split(pattern, '/');
  const std::vector<std::string> given = Split(path, '/');
  numbers.clear();
  for (size_t i = 0; i < wanted.size() && wanted.size() == given.size(); ++i) {
    if (wanted[i].empty() || wanted[i][0] != '{') {
      if (wanted[i] != given[i]) {
        return false;
      }
    } else if (given[i].empty() || given[i].size() > kMostDigits ||
               given[i].find_first_not_of("0123456789") != std::string::npos) {
      return false;
    } else {
      numbers.push_back(std::stoll(given[i]));
    }
  }
  return wanted.size() == given.size();
}

class Refused : public Exchange {
 public:
  Refused(unsigned status, std::string message) : status_(status), message_(std::move(message)) {}
  void Take(std::string_view /*bytes*/) override {}
  void Finish(Reply reply) override { reply(ErrorAnswer(status_, message_)); }

 private:
  const unsigned status_;
  const std::string message_;
};

class Healthy : public Exchange {
 public:
  void Take(std::string_view /*bytes*/) override {}
  void Finish(Reply reply) override { reply(JsonAnswer(Json::Value(Json::objectValue))); }
};

// A question that is answered by a worker.
class Question : public Exchange {
 public:
  Question(ApiCall call, Answer (*handle)(ApiCall&)) : call_(std::move(call)), handle_(handle) {}

  void Take(std::string_view bytes) override {
    size_ += bytes.size();
    if (size_ <= kMostBody) {
      body_.append(bytes);
    }
  }

  void Finish(Reply reply) override {
    call_.desk.queries.Do([this, reply = std::move(reply)] { reply(Try()); });
  }

 private:
  Answer Try() {
    Answer answer;
    try {
      if (size_ > kMostBody) {
        throw ApiError(413, "the body is too large");
      }
      if (!body_.empty() && !ReadJson(body_, call_.body)) {
        throw ApiError(400, "the body is no JSON");
      }
      answer = handle_(call_);
    } catch (const ApiError& error) {
      answer = ErrorAnswer(error.status, error.what());
    } catch (const std::invalid_argument& error) {
      answer = ErrorAnswer(400, error.what());
    } catch (const std::exception& error) {
      LogLine(error.what());
      answer = ErrorAnswer(500, "the desk's log tells why this failed");
    }
    AddSafeHeaders(answer);
    return answer;
  }

  ApiCall call_;
  Answer (*const handle_)(ApiCall&);
  std::string body_;
  size_t size_ = 0;
};

struct Target {
  std::string path;
  std::string query;
};

Target TargetOf(const std::string& target) {
  const size_t mark = std::min(target.find('?'), target.size());
  return {target.substr(0, mark), mark < target.size() ? target.substr(mark + 1) : ""};
}

}  // namespace

// A name that somebody made resolve to this machine is none of ours, whatever page asks under it.
bool ApiService::FromHere(const std::string& host) const {
  const std::string port = ":" + std::to_string(desk_.settings.people_port);
  return host == "127.0.0.1" + port || host == "localhost" + port;
}

std::unique_ptr<Exchange> ApiService::Begin(const RequestHead& head) {
  const Target target = TargetOf(head.target);
  const std::string origin = head.header("Origin");
  const size_t scheme = std::min(origin.find("://"), origin.size());
  if (!FromHere(head.header("Host")) ||
      (!origin.empty() && !FromHere(origin.substr(std::min(scheme + 3, origin.size()))))) {
    return std::make_unique<Refused>(403, "this is asked from elsewhere");
  }
  ApiCall call{desk_, table_, {}, QueryOf(target.query), Json::Value()};
  if (target.path == "/healthz") {
    return std::make_unique<Healthy>();
  }
  if (target.path == "/metrics") {
    return std::make_unique<Question>(std::move(call), MetricsAnswer);
  }
  if (!SameSecret(head.header("Authorization"), "Bearer " + token_)) {
    return std::make_unique<Refused>(401, "the token is missing or wrong");
  }
  bool path = false;
  for (const ApiRoute& route : ApiRouteTable()) {
    if (Matches(std::string(kBase) + route.path, target.path, call.numbers)) {
      if (head.method == route.method) {
        return std::make_unique<Question>(std::move(call), route.handle);
      }
      path = true;
    }
  }
  return path ? std::make_unique<Refused>(405, "this cannot be done with it")
              : std::make_unique<Refused>(404, "there is no such thing");
}

std::vector<std::pair<std::string, std::string>> ApiRoutes() {
  std::vector<std::pair<std::string, std::string>> routes;
  for (const ApiRoute& route : ApiRouteTable()) {
    routes.emplace_back(route.method, std::string(kBase) + route.path);
  }
  return routes;
}

}  // namespace quendeldesk
