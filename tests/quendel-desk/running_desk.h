// A real quendel-desk on the test's appliance, and what a program or a device asks of it.
#ifndef TESTS_QUENDEL_DESK_RUNNING_DESK_H_
#define TESTS_QUENDEL_DESK_RUNNING_DESK_H_

#include <json/value.h>
#include <sys/types.h>

#include <string>
#include <vector>

namespace quendel::test {

constexpr char kDeskFolder[] = "/volume1/desk";

class RunningDesk {
 public:
  // Starts it with these options besides the folder, and waits until it listens.
  explicit RunningDesk(const std::vector<std::string>& options = {});
  ~RunningDesk();

  void Kill();  // as kill -9 does
  void Stop();  // asks it to end, and expects that it does so well
  void Start();

  pid_t process() const { return process_; }
  // Tells whether the access log holds a text. A line may come a moment after the reply.
  bool Logs(const std::string& text) const;
  std::string Output() const;  // the access log
  std::string Errors() const;  // what it says of itself

 private:
  std::vector<std::string> options_;
  pid_t process_ = 0;
};

struct HttpReply {
  long status = 0;  // 0 when there was none
  std::string body;
  std::string headers;
};

// Asks the programs' side, with the desk's token unless `headers` are given.
HttpReply Ask(const std::string& method, const std::string& path, const std::string& body = "");
HttpReply AskWith(const std::vector<std::string>& headers, const std::string& method,
                  const std::string& path, const std::string& body = "");
Json::Value AskJson(const std::string& path);
std::string Token();

// Posts a JSON text to a path of the devices' side, as it is. Returns the reply.
Json::Value PostAsDevice(const std::string& path, const std::string& body = "null");

// The number of the device with the serial number of the appliance; 0 when the desk has none.
int DeviceNumber(const std::string& serial = "S1");

// The path "/devices/N" + what, of that device.
std::string DevicePath(const std::string& what = "");

// Runs a command of the program on the desk's folder. Returns its exit status; `output` gets what
// it printed, on either way.
int RunDesk(const std::vector<std::string>& arguments, std::string& output);

}  // namespace quendel::test

#endif  // TESTS_QUENDEL_DESK_RUNNING_DESK_H_
