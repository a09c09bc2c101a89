// Answers programs: the interface that openapi.json describes.
#ifndef QUENDEL_DESK_API_SERVICE_H_
#define QUENDEL_DESK_API_SERVICE_H_

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "desk.h"
#include "http.h"

namespace quendeldesk {

class ApiService : public Service {
 public:
  ApiService(Desk& desk, const ConnectionTable& table, std::string token)
      : desk_(desk), table_(table), token_(std::move(token)) {}

  std::unique_ptr<Exchange> Begin(const RequestHead& head) override;

 private:
  bool FromHere(const std::string& host) const;

  Desk& desk_;
  const ConnectionTable& table_;
  const std::string token_;
};

// The methods and paths there are, such as {"GET", "/api/v1/devices/{id}"}.
std::vector<std::pair<std::string, std::string>> ApiRoutes();

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_API_SERVICE_H_
