// What a device asks for, as the path of its request says.
#ifndef QUENDEL_DESK_DEVICE_REQUEST_H_
#define QUENDEL_DESK_DEVICE_REQUEST_H_

#include <optional>
#include <string>

#include "records.h"

namespace quendeldesk {

struct DeviceRequest {
  enum class Kind { kHeartbeat, kProgress, kEvent, kCollection, kUpload };
  Kind kind = Kind::kHeartbeat;
  Sender sender;
  long long request_id = 0;
  long long progress = 0;
};

// Reads a path. Its pieces are taken as they are, empty ones too: devices encode nothing. Returns
// nothing for one that no device asks for.
std::optional<DeviceRequest> DeviceRequestFrom(const std::string& target);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DEVICE_REQUEST_H_
