// Texts into the fixed room that a caller has for them.
#ifndef PLATFORM_STANDALONE_COPY_TEXT_H_
#define PLATFORM_STANDALONE_COPY_TEXT_H_

#include <algorithm>
#include <cstring>
#include <string_view>

namespace platform {

// Copies a text, cut to room - 1 bytes and NUL-terminated; nothing at all into no room.
inline void CopyText(std::string_view text, char* buf, size_t room) {
  if (room == 0) {
    return;
  }
  const size_t length = std::min(text.size(), room - 1);
  memcpy(buf, text.data(), length);
  buf[length] = '\0';
}

}  // namespace platform

#endif  // PLATFORM_STANDALONE_COPY_TEXT_H_
