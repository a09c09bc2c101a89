// The device's time zone, and what the system's time zone data tells of one.
#include "platform/zone.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "platform/standalone/copy_text.h"
#include "platform/standalone/device_conf.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr char kZoneNamePath[] = "/etc/timezone";
constexpr char kLocalTimePath[] = "/etc/localtime";
constexpr char kZoneDataDir[] = "/usr/share/zoneinfo/";
constexpr char kPlaceTablePath[] = "/usr/share/zoneinfo/zone.tab";

constexpr int kMaxOffsetHours = 167;
constexpr int kSecondsPerMinute = 60;
constexpr int kSecondsPerHour = 3600;

bool IsNameByte(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '_' ||
         c == '+' || c == '-' || c == '/';
}

// A name becomes part of a path, so it must not lead out of the time zone data: no zone's name has
// a dot in it, or begins with a slash.
bool IsZoneName(const std::string& name) {
  return !name.empty() && name.front() != '/' && std::all_of(name.begin(), name.end(), IsNameByte);
}

std::string NameFromDeviceConf() {
  DeviceConf conf;
  return conf.Read() ? conf.Value("timezone") : std::string();
}

std::string NameFromSystemFile() {
  std::string text;
  if (!ReadWholeFile(kZoneNamePath, text)) {
    return std::string();
  }
  return text.substr(0, text.find_first_of(" \t\r\n"));
}

// The system's own time is a link into the time zone data.
std::string NameFromSystemLink() {
  char target[PATH_MAX];
  const ssize_t length = readlink(kLocalTimePath, target, sizeof(target));
  if (length < 0) {
    return std::string();
  }
  const std::string_view path(target, static_cast<size_t>(length));
  constexpr std::string_view kParent = "/zoneinfo/";
  const size_t parent = path.rfind(kParent);
  return parent == std::string_view::npos ? std::string()
                                          : std::string(path.substr(parent + kParent.size()));
}

std::string ConfiguredName() {
  for (const auto source : {NameFromDeviceConf, NameFromSystemFile, NameFromSystemLink}) {
    std::string name = source();
    if (!name.empty()) {
      return name;
    }
  }
  return std::string();
}

// The table has one place a line, with the zone in the third of its columns.
std::string_view ZoneOfPlace(std::string_view line) {
  for (int column = 1; column < 3; ++column) {
    const size_t tab = line.find('\t');
    if (tab == std::string_view::npos) {
      return std::string_view();
    }
    line.remove_prefix(tab + 1);
  }
  return line.substr(0, line.find('\t'));
}

int PlaceInTable(const std::string& name) {
  std::string table;
  if (!ReadWholeFile(kPlaceTablePath, table)) {
    return -1;
  }
  int place = 0;
  for (std::string_view rest = table; !rest.empty();) {
    const std::string_view line = rest.substr(0, rest.find('\n'));
    rest.remove_prefix(std::min(line.size() + 1, rest.size()));
    if (line.empty() || line.front() == '#') {
      continue;
    }
    if (ZoneOfPlace(line) == name) {
      return place;
    }
    ++place;
  }
  return -1;
}

// The rule for the years to come stands in the last line of the data, as a text of the kind that
// the variable TZ takes: "CET-1CEST,M3.5.0,M10.5.0/3". Returns an empty text for what is no such
// data.
std::string RuleOf(const std::string& data) {
  constexpr std::string_view kMagic = "TZif";
  if (data.compare(0, kMagic.size(), kMagic) != 0 || data.back() != '\n') {
    return std::string();
  }
  const size_t end = data.size() - 1;
  const size_t before = data.rfind('\n', end - 1);
  return before == std::string::npos ? std::string() : data.substr(before + 1, end - before - 1);
}

// Takes an abbreviation, letters or anything in angle brackets, off the front of a rule.
bool TakeAbbreviation(std::string_view& rule) {
  size_t length = 0;
  if (!rule.empty() && rule.front() == '<') {
    length = rule.find('>') + 1;  // 0 when the bracket is not closed
  } else {
    length = std::min(rule.find_first_of("+-,0123456789"), rule.size());
  }
  rule.remove_prefix(length);
  return length > 0;
}

bool TakeNumber(std::string_view& rule, int& number) {
  const size_t length = std::min(rule.find_first_not_of("0123456789"), rule.size());
  if (length < 1 || length > 3) {
    return false;
  }
  std::from_chars(rule.data(), rule.data() + length, number);
  rule.remove_prefix(length);
  return true;
}

// Takes an offset, [+-]hh[:mm[:ss]], off the front of a rule. In a rule west is positive; the
// result is seconds east of Greenwich.
bool TakeOffset(std::string_view& rule, int& seconds) {
  const bool isEast = !rule.empty() && rule.front() == '-';
  if (!rule.empty() && (rule.front() == '-' || rule.front() == '+')) {
    rule.remove_prefix(1);
  }
  int part = 0;
  if (!TakeNumber(rule, part) || part > kMaxOffsetHours) {
    return false;
  }
  int west = part * kSecondsPerHour;
  for (int unit = kSecondsPerMinute; unit > 0 && !rule.empty() && rule.front() == ':';
       unit /= kSecondsPerMinute) {
    rule.remove_prefix(1);
    if (!TakeNumber(rule, part)) {
      return false;
    }
    west += part * unit;
  }
  seconds = isEast ? west : -west;
  return true;
}

// Some zones call their winter time the daylight saving one; what a reader knows a zone by is the
// smaller offset in any case.
bool WinterOffset(std::string_view rule, int& seconds) {
  if (!TakeAbbreviation(rule) || !TakeOffset(rule, seconds)) {
    return false;
  }
  if (rule.empty()) {
    return true;
  }
  int summer = seconds + kSecondsPerHour;
  if (!TakeAbbreviation(rule)) {
    return false;
  }
  if (!rule.empty() && rule.front() != ',' && !TakeOffset(rule, summer)) {
    return false;
  }
  seconds = std::min(seconds, summer);
  return true;
}

std::string Describe(const std::string& name, int seconds) {
  const int minutes = std::abs(seconds) / kSecondsPerMinute;
  char offset[32];
  snprintf(offset, sizeof(offset), "(GMT%c%02d:%02d) ", seconds < 0 ? '-' : '+', minutes / 60,
           minutes % 60);
  return offset + name;
}

int FailForZone() {
  errno = ENOENT;
  return Fail(kErrorNoTimeZone);
}

}  // namespace
}  // namespace platform

int ARVOZoneGet(char* zone, int size, int* index) try {
  if (zone == nullptr || size < 1) {
    return platform::FailForArgument();
  }
  const std::string name = platform::ConfiguredName();
  if (!platform::IsZoneName(name)) {
    return platform::FailForZone();
  }
  if (index != nullptr) {
    *index = platform::PlaceInTable(name);
  }
  platform::CopyText(name, zone, static_cast<size_t>(size));
  return 0;
} catch (...) {
  return platform::FailForException();
}

int ARVOZoneDesc(const char* zone, char* desc, int size) try {
  if (zone == nullptr || desc == nullptr || size < 1) {
    return platform::FailForArgument();
  }
  std::string data;
  if (!platform::IsZoneName(zone) ||
      !platform::ReadWholeFile((std::string(platform::kZoneDataDir) + zone).c_str(), data)) {
    return platform::FailForZone();
  }
  int seconds = 0;
  if (!platform::WinterOffset(platform::RuleOf(data), seconds)) {
    return platform::FailForZone();
  }
  platform::CopyText(platform::Describe(zone, seconds), desc, static_cast<size_t>(size));
  return 0;
} catch (...) {
  return platform::FailForException();
}
