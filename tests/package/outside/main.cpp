// A program outside the project that uses an installed libquendel: sends a heartbeat and shows what
// it touched on the way.
#include <quendel.h>

#include <iostream>

int main() {
  Json::Value actions;
  const int result = QUENDELHeartbeat(actions);
  std::cout << "version " << QUENDEL_VERSION << '\n'
            << "request " << QUENDELGenerateReq({"heartbeat", "S1"}) << '\n'
            << "event " << QUENDEL_ACTION_NAMES[QUENDEL_EVENT_REBOOT] << '\n'
            << "errors " << QUENDELWebapiErrorMap.size() << '\n'
            << "heartbeat " << result << '\n';
  return result == 0 ? 0 : 1;
}
