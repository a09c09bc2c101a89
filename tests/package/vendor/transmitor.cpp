// Uses every byte of its object, and notices when one of them is somebody else's too.
#include "platform/transmitor.h"

#include <algorithm>
#include <cstring>

Transmitor::Transmitor(const std::string&) {
  memset(state_, 'v', sizeof state_);
}

int Transmitor::Transmit(const Json::Value&) {
  return std::count(state_, state_ + sizeof state_, 'v') == sizeof state_ ? 0 : -1;
}

int Transmitor::GetDataJson(Json::Value& reply) {
  reply["success"] = true;
  reply["data"]["time"] = 1;
  reply["data"]["Memory"]["vendor_bytes"] = static_cast<int>(sizeof state_);
  return 0;
}
