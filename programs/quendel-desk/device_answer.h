// The answers that devices get.
#ifndef QUENDEL_DESK_DEVICE_ANSWER_H_
#define QUENDEL_DESK_DEVICE_ANSWER_H_

#include <json/value.h>

#include <exception>

#include "http.h"
#include "records.h"

namespace quendeldesk {

// With actions, unless they are null, where the verdict is good.
Answer DeviceAnswer(const Verdict& verdict, const Json::Value& actions = Json::Value());

// The verdict on a request that could not be carried out.
Verdict VerdictOf(const std::exception_ptr& failure);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DEVICE_ANSWER_H_
