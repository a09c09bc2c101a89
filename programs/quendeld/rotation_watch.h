// Sees the collected logs rotate, and asks for a collection once that is over.
#ifndef QUENDELD_ROTATION_WATCH_H_
#define QUENDELD_ROTATION_WATCH_H_

#include <json/value.h>

#include <map>
#include <memory>
#include <set>
#include <string>

#include "collections.h"
#include "context.h"

namespace quendeld {

// Whether a file of this name is an archive of a log, or of what a rotation leaves of it.
bool IsArchiveName(const std::string& log, const std::string& name);

class RotationWatch {
 public:
  RotationWatch(const Context& context, Collections& collections);
  ~RotationWatch();
  RotationWatch(const RotationWatch&) = delete;
  RotationWatch& operator=(const RotationWatch&) = delete;

  // Watches the folders of these logs, and no others.
  void Watch(const Json::Value& logs);

 private:
  void Read();
  void See(int folder, const std::string& name);
  void LookWhetherOver();
  void AwaitLines();

  const Context context_;
  Collections& collections_;
  int inotify_ = -1;
  std::unique_ptr<Readable> readable_;
  std::map<std::string, int> folders_;              // and their watches
  std::map<int, std::set<std::string>> log_names_;  // of each watch
  Timer timer_;
  Timer lines_timer_;
  bool is_rotating_ = false;
  bool was_locked_ = false;
  Duration last_seen_{};
  Duration over_since_{};
};

}  // namespace quendeld

#endif  // QUENDELD_ROTATION_WATCH_H_
