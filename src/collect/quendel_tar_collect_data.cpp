// Packs a run directory into one archive.
#include <string>

#include "base/log.h"
#include "platform/process.h"
#include "quendel/collect.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_tar_collect_data";

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELTarCollectData(const char* dir, const char* archive) try {
  const std::string path = dir;
  const size_t slash = path.rfind('/');
  const std::string parent = path.substr(0, slash);
  const std::string base = slash == std::string::npos ? path : path.substr(slash + 1);
  if (ALIBCExecl("/bin/tar", platform::kRunFlags, "-C", parent.c_str(), "-Jcvf", archive,
                 base.c_str(), nullptr) != 0) {
    QUENDEL_LOG("Failed to tar '%s'", dir);
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to tar '%s'", dir);
  return -1;
}
