// The device's web API, called inside this process.
#ifndef PLATFORM_API_RUNNER_H_
#define PLATFORM_API_RUNNER_H_

#include <json/value.h>

namespace ARVO {

class APIRunner {
 public:
  // Calls a method of an API as a user of the device. `out` gets the reply: an object with
  // "success", and, when that is false, "error" with a numeric "code": 101 for a bad parameter, 102
  // for an unknown API, 103 for an unknown method, 104 for an unknown version, 105 for a user who
  // may not call it, 100 for anything else.
  static void Exec(Json::Value& out, const char* api, int version, const char* method,
                   const Json::Value& params, const char* user);
};

}  // namespace ARVO

#endif  // PLATFORM_API_RUNNER_H_
