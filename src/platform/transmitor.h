// The client of the device's performance service.
#ifndef PLATFORM_TRANSMITOR_H_
#define PLATFORM_TRANSMITOR_H_

#include <json/value.h>

#include <string>

// Asks the performance service of one host for its figures. An object makes one request at a time
// and holds the answer until it is taken.
class Transmitor {
 public:
  // Names the host; "localhost" is this device, and the only one that answers.
  explicit Transmitor(const std::string& host);

  // Sends a request. The only one that is known is {"request": "curr"}, for the current figures.
  // Returns 0, or negative when the host or the request is not known.
  int Transmit(const Json::Value& request);

  // Takes the answer to the last request. For the current figures it is an object with "success"
  // true and "data", an object with "time" and one member per category: "System", "DiskIO",
  // "SpaceIO", "Network", "Memory" and "iSCSI". What each figure is stands in
  // docs/performance-figures.md. Returns 0, or negative, with `reply` untouched, when there is no
  // answer to take.
  int GetDataJson(Json::Value& reply);

 private:
  std::string host_;
  Json::Value reply_;
};

#endif  // PLATFORM_TRANSMITOR_H_
