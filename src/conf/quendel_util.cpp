// Small helpers: files and directories through the platform, MD5 and hexadecimal text.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "base/md5.h"
#include "platform/file.h"
#include "platform/process.h"
#include "quendel/conf.h"

namespace quendel {
namespace {

// The options of the platform's copy: 80 bytes, of which two flag words are known.
struct CopyOptions {
  uint32_t words[20];
};
static_assert(sizeof(CopyOptions) == 80);

// Neither the current directory nor the root may ever be made or removed. Only these two spellings
// are known; "./" and "//" are the caller's own doing.
bool IsProtected(const char* path) {
  return strcmp(path, ".") == 0 || strcmp(path, "/") == 0;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELFileCopy(const char* src, const char* dst) {
  CopyOptions options = {};
  options.words[0] = 1;
  options.words[2] = 1;
  return ARVOFileCopy(src, dst, &options);
}

int QUENDELRecursiveMkdir(const char* path, unsigned int mode) {
  if (IsProtected(path)) {
    return 0;
  }
  char modeText[8];
  snprintf(modeText, sizeof modeText, "%o", mode);
  // Deliberate: the path stands before "-m".
  // Deliberate: what the tool itself reports is not looked at; callers make directories as best
  // they can and find out when they use them.
  return ALIBCExec("/bin/mkdir", "-p", path, "-m", modeText) == -1 ? -1 : 0;
}

int QUENDELRecursiveRmdir(const char* path) {
  if (IsProtected(path)) {
    return 0;
  }
  // Deliberate: as above, a tool that ran and failed is no failure here.
  return ALIBCExec("/bin/rm", "-f", "-r", path, nullptr) == -1 ? -1 : 0;
}

void QUENDELMD5String(const std::string& text, char* out) {
  Md5 md5;
  md5.Add(text.data(), text.size());
  md5.Finish(out);
}

void QUENDELBytesToHex(std::string& out, const unsigned char* bytes, int len) try {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string hex;
  for (int i = 0; i < len; ++i) {
    hex += kDigits[bytes[i] >> 4];
    hex += kDigits[bytes[i] & 0xf];
  }
  out.swap(hex);
} catch (...) {
  out.clear();
}

void QUENDELHexToBytes(const std::string& hex, unsigned char* out, int maxlen) {
  size_t position = 0;
  for (int n = 0; n < maxlen && position < hex.size(); ++n, position += 2) {
    char pair[3] = {};
    hex.copy(pair, 2, position);
    out[n] = static_cast<unsigned char>(strtol(pair, nullptr, 16));
  }
}
