// One line for each request, on the standard output.
#include "access_log.h"

#include <unistd.h>

#include <cstdio>
#include <ctime>

namespace quendeldesk {
namespace {

std::string Timestamp() {
  timespec now = {};
  clock_gettime(CLOCK_REALTIME, &now);
  tm utc = {};
  gmtime_r(&now.tv_sec, &utc);
  char text[40];
  const size_t size = strftime(text, sizeof(text), "%Y-%m-%dT%H:%M:%S", &utc);
  snprintf(text + size, sizeof(text) - size, ".%03ldZ", now.tv_nsec / 1'000'000);
  return text;
}

// In one call, so that the lines of several threads do not mix. A log that cannot be written is no
// reason to stop serving.
void WriteLine(int descriptor, const std::string& line) {
  if (write(descriptor, line.data(), line.size()) < 0) {
    return;
  }
}

}  // namespace

std::string Printable(const std::string& text) {
  std::string printable;
  for (const char c : text) {
    char code[8];
    if (c == '"' || c == '\\') {
      printable += '\\';
      printable += c;
    } else if (c < ' ' || c > '~') {
      snprintf(code, sizeof(code), "\\x%02x", static_cast<unsigned>(c) & 0xFF);
      printable += code;
    } else {
      printable += c;
    }
  }
  return printable;
}

void WriteAccessLine(const AccessLine& line) {
  constexpr size_t kMostTarget = 1024;
  using std::chrono::duration_cast;
  using std::chrono::milliseconds;
  std::string text = Timestamp() + " " + line.address + " \"" + Printable(line.method) + " " +
                     Printable(line.target.substr(0, kMostTarget)) + "\" ";
  text += line.cut ? "cut" : std::to_string(line.status);
  text += " code=" + std::to_string(line.code) + " in=" + std::to_string(line.received) +
          " ms=" + std::to_string(duration_cast<milliseconds>(line.duration).count());
  if (!line.note.empty()) {
    text += " note=\"" + Printable(line.note) + "\"";
  }
  WriteLine(STDOUT_FILENO, text + "\n");
}

void LogLine(const std::string& text) {
  WriteLine(STDERR_FILENO, "quendel-desk: " + text + "\n");
}

}  // namespace quendeldesk
