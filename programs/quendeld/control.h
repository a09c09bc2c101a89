// The socket through which root asks the daemon.
#ifndef QUENDELD_CONTROL_H_
#define QUENDELD_CONTROL_H_

#include <json/value.h>

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "loop.h"

namespace quendeld {

class Control {
 public:
  using Reply = std::function<void(const Json::Value& answer)>;
  // Answers a request, now or later, by one call of `reply`.
  using Handler = std::function<void(const Json::Value& request, Reply reply)>;

  // Listens at `path`, in place of whatever an earlier daemon left there. Throws std::system_error.
  Control(Loop& loop, const std::string& path, Handler handler);
  ~Control();
  Control(const Control&) = delete;
  Control& operator=(const Control&) = delete;

 private:
  struct Connection {
    int socket = -1;
    std::string request;
    bool is_asked = false;
    std::unique_ptr<Readable> readable;
    ~Connection();
  };

  void Accept();
  void Read(int64_t id);
  void Answer(int64_t id, const Json::Value& answer);

  Loop& loop_;
  const std::string path_;
  const Handler handler_;
  int listener_ = -1;
  std::unique_ptr<Readable> readable_;
  std::map<int64_t, std::unique_ptr<Connection>> connections_;
  int64_t accepted_ = 0;
};

}  // namespace quendeld

#endif  // QUENDELD_CONTROL_H_
