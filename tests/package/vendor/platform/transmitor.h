// A vendor's client of the performance service: the calls that libquendel makes, and an object of a
// size and shape that are the vendor's own.
#ifndef VENDOR_TRANSMITOR_H_
#define VENDOR_TRANSMITOR_H_

#include <json/value.h>

#include <string>

class Transmitor {
 public:
  explicit Transmitor(const std::string& host);
  int Transmit(const Json::Value& request);
  int GetDataJson(Json::Value& reply);

 private:
  char state_[8192];
};

#endif  // VENDOR_TRANSMITOR_H_
