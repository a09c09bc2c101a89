// Answers the devices.
#ifndef QUENDEL_DESK_DEVICE_SERVICE_H_
#define QUENDEL_DESK_DEVICE_SERVICE_H_

#include <memory>

#include "desk.h"
#include "http.h"

namespace quendeldesk {

class DeviceService : public Service {
 public:
  explicit DeviceService(Desk& desk) : desk_(desk) {}
  std::unique_ptr<Exchange> Begin(const RequestHead& head) override;

 private:
  Desk& desk_;
};

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DEVICE_SERVICE_H_
