// The device's web API, called inside this process.
#ifndef PLATFORM_API_RUNNER_H_
#define PLATFORM_API_RUNNER_H_

#include <json/value.h>

namespace ARVO {

class APIRunner {
 public:
  // Calls a method of an API as a user of the device. `out` gets the reply: an object with
  // "success" and, when that is false, "error" with a numeric "code": 400 for parameters that the
  // method does not take, 403 for a user who may not call it, 404 for an API, version or method
  // that is not there, 500 when the method itself failed.
  static void Exec(Json::Value& out, const char* api, int version, const char* method,
                   const Json::Value& params, const char* user);
};

}  // namespace ARVO

#endif  // PLATFORM_API_RUNNER_H_
