// Messages that are too long for the system's log.
#include "base/log.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "base/owned_fd.h"

namespace quendel {
namespace {

constexpr char kMark[] = "...";

// No system's log takes less.
constexpr int kAlwaysTakenBytes = 4000;

// What a socket may send where nobody has changed that.
constexpr int kUsualBytes = 212992;

// What comes on top of a message: its time, the program's name and number, and the kernel's own.
constexpr int kHeadBytes = 992;

// What a message says besides its texts.
constexpr int kWordsBytes = 400;

// How long a message may be, as a new socket of the log's kind tells it.
int LongestMessage() {
  const OwnedFd log(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  int bytes = kUsualBytes;
  socklen_t size = sizeof bytes;
  if (!log || getsockopt(log.get(), SOL_SOCKET, SO_SNDBUF, &bytes, &size) != 0) {
    bytes = kUsualBytes;
  }
  return std::max(bytes - kHeadBytes, kAlwaysTakenBytes);
}

// How many of the texts that follow the unit's name there are to share the room.
int CountTexts(const char* format) {
  int texts = -1;
  for (const char* at = strstr(format, "%s"); at != nullptr; at = strstr(at + 1, "%s")) {
    ++texts;
  }
  return std::max(texts, 1);
}

// Tells where to cut a text that is longer than `most`: not inside a character of several bytes.
int CutAt(const char* text, int most) {
  int cut = most;
  while (cut > most - 4 && (text[cut] & 0xC0) == 0x80) {
    --cut;
  }
  return cut;
}

// Returns the conversion of a text that may take `most` bytes.
void DescribeText(char (&conversion)[32], const char* text, int most) {
  if (text == nullptr ||
      strnlen(text, static_cast<size_t>(most) + 1) <= static_cast<size_t>(most)) {
    snprintf(conversion, sizeof conversion, "%%s");
  } else {
    snprintf(conversion, sizeof conversion, "%%.%ds%s", CutAt(text, most), kMark);
  }
}

// NOLINTBEGIN(clang-analyzer-valist.Uninitialized): whoever passes a list has started it.

// Takes a conversion's arguments. Returns the text of a plain %s, else null.
const char* TakeArguments(const char* flags, char letter, va_list& arguments) {
  if (*flags == '.') {
    va_arg(arguments, int);
  }
  switch (letter) {
    case 'd':
      *flags == 'l' ? va_arg(arguments, long) : va_arg(arguments, int);
      break;
    case 's':
      return va_arg(arguments, const char*);
    default:
      break;
  }
  return nullptr;
}

// Writes a format whose texts take `most` bytes each. Returns false when it does not fit.
bool Shorten(char (&shortened)[kLogFormatBytes], const char* format, va_list& arguments, int most) {
  size_t used = 0;
  while (*format != '\0') {
    const size_t words = strcspn(format, "%");
    const char* const flags = format + words + 1;
    const size_t flagCount = format[words] == '%' ? strspn(flags, ".*l") : 0;
    const char letter = format[words] == '%' ? flags[flagCount] : '\0';
    const size_t length = letter == '\0' ? words : words + 1 + flagCount + 1;
    const char* const text = letter == '\0' ? nullptr : TakeArguments(flags, letter, arguments);
    char conversion[32] = {};
    const bool isPlainText = letter == 's' && flagCount == 0;
    if (isPlainText) {
      DescribeText(conversion, text, most);
    }
    const int written =
        snprintf(shortened + used, sizeof shortened - used, "%.*s%s",
                 static_cast<int>(isPlainText ? words : length), format, conversion);
    used += static_cast<size_t>(std::max(written, 0));
    if (used >= sizeof shortened) {
      return false;
    }
    format += length;
  }
  return true;
}

}  // namespace

// NOLINTNEXTLINE(cert-dcl50-cpp): it takes what syslog() takes.
const char* LogFormat(char (&shortened)[kLogFormatBytes], const char* format, ...) {
  const int reason = errno;
  const char* chosen = format;
  va_list arguments;
  va_start(arguments, format);
  const int length = vsnprintf(nullptr, 0, format, arguments);
  va_end(arguments);
  // A length that no number holds is too long as well.
  if (length < 0 || length > kAlwaysTakenBytes) {
    const int longest = LongestMessage();
    const int most = std::max((longest - kWordsBytes) / CountTexts(format), 8);
    va_start(arguments, format);
    if ((length < 0 || length > longest) && Shorten(shortened, format, arguments, most)) {
      chosen = shortened;
    }
    va_end(arguments);
  }
  errno = reason;
  return chosen;
}
// NOLINTEND(clang-analyzer-valist.Uninitialized)

}  // namespace quendel
