// Receives the files of a collection or an upload.
#ifndef QUENDEL_DESK_DELIVERY_EXCHANGE_H_
#define QUENDEL_DESK_DELIVERY_EXCHANGE_H_

#include <memory>
#include <string>

#include "desk.h"
#include "device_request.h"

namespace quendeldesk {

// Returns why files are not taken at all, if they are not: there are too many bytes, or too little
// room.
Verdict DeliveryRefusal(const Desk& desk, const RequestHead& head);

std::unique_ptr<Exchange> BeginDelivery(Desk& desk, const DeviceRequest& request,
                                        const std::string& contentType);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DELIVERY_EXCHANGE_H_
