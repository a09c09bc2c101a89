// Reads the key of the current remote session from the platform's authentication tool.
#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/log.h"
#include "platform/process.h"
#include "quendel/upload.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "util";

constexpr char kAuthTool[] = "/usr/arvo/sbin/arvocloudserviceauth";

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELGetRemoteSessionKey(char* buf, int size) {
  std::FILE* output = ALIBCPopen(kAuthTool, "r", "-a", "get", "-f", nullptr);
  if (output == nullptr) {
    QUENDEL_LOG("ALIBCPopen failed(%s)\n", strerror(errno));
    return -1;
  }
  const int room = std::max(size, 0);
  int result = 0;
  if (fread(buf, 1, static_cast<size_t>(room), output) == 0) {
    // Deliberate: the line shows what the caller left in the buffer, which need not hold a NUL.
    QUENDEL_LOG("Failed to read relay status (%.*s)\n", room, buf);
    result = -1;
  }
  ALIBCPclose(output);
  return result;
}
