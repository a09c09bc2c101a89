// What programs may ask, and how each question is answered.
#ifndef QUENDEL_DESK_API_ROUTES_H_
#define QUENDEL_DESK_API_ROUTES_H_

#include <json/value.h>

#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "desk.h"
#include "http.h"

namespace quendeldesk {

// An answer other than 200.
class ApiError : public std::runtime_error {
 public:
  ApiError(unsigned httpStatus, const std::string& message)
      : std::runtime_error(message), status(httpStatus) {}
  const unsigned status;
};

struct ApiCall {
  Desk& desk;
  const ConnectionTable& table;
  std::vector<long long> numbers;  // of the path, in their order
  std::map<std::string, std::string> query;
  Json::Value body;
};

struct ApiRoute {
  const char* method;
  const char* path;  // below "/api/v1"; "{...}" is a number
  Answer (*handle)(ApiCall& call);
};

const std::vector<ApiRoute>& ApiRouteTable();

Answer JsonAnswer(const Json::Value& body, unsigned status = 200);

// The answer to "/metrics".
Answer MetricsAnswer(ApiCall& call);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_API_ROUTES_H_
