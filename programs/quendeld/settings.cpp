#include "settings.h"

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <optional>
#include <sstream>
#include <variant>

namespace quendeld {
namespace {

using Field = std::variant<Duration Settings::*, int64_t Settings::*, bool Settings::*>;

// Limits are in the unit of the value: seconds, or what the key says.
struct Row {
  const char* key;
  Field field;
  double least;
  double most;
};

constexpr double kYear = 366.0 * 24 * 3600;

constexpr Row kRows[] = {
    {"heartbeat_interval", &Settings::heartbeat_interval, 0.05, kYear},
    {"heartbeat_jitter", &Settings::heartbeat_jitter, 0, 50},
    {"heartbeat_backoff_limit", &Settings::heartbeat_backoff_limit, 0.05, kYear},
    {"first_heartbeat_within", &Settings::first_heartbeat_within, 0, 3600},
    {"collection_interval", &Settings::collection_interval, 0.2, kYear},
    {"collection_retry", &Settings::collection_retry, 0.1, kYear},
    {"sample_interval", &Settings::sample_interval, 0.05, kYear},
    {"samples_kept", &Settings::samples_kept, 1, 100000},
    {"conversation_limit", &Settings::conversation_limit, 0.2, 3600},
    {"collection_limit", &Settings::collection_limit, 1, 7.0 * 24 * 3600},
    {"upload_limit", &Settings::upload_limit, 1, 7.0 * 24 * 3600},
    {"local_limit", &Settings::local_limit, 0.2, 3600},
    {"kill_after", &Settings::kill_after, 0.1, 60},
    {"memory_limit_mb", &Settings::memory_limit_mb, 0, 1 << 20},
    {"outbox_limit_mb", &Settings::outbox_limit_mb, 0, 1 << 20},
    {"free_space_mb", &Settings::free_space_mb, 0, 1 << 20},
    {"rotation_quiet", &Settings::rotation_quiet, 0.1, 3600},
    {"rotation_wait", &Settings::rotation_wait, 0.1, 24.0 * 3600},
    {"session_limit", &Settings::session_limit, 1, kYear},
    {"actions_per_heartbeat", &Settings::actions_per_heartbeat, 1, 1000},
    {"request_ids_kept", &Settings::request_ids_kept, 100, 1000000},
    {"events_kept", &Settings::events_kept, 10, 100000},
    {"allow_power_actions", &Settings::allow_power_actions, 0, 1},
};

std::string Trimmed(const std::string& text) {
  constexpr char kBlanks[] = " \t\r";
  const size_t begin = text.find_first_not_of(kBlanks);
  return begin == std::string::npos
             ? std::string()
             : text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

std::string Unquoted(const std::string& text) {
  const bool isQuoted = text.size() >= 2 && text.front() == '"' && text.back() == '"';
  return isQuoted ? text.substr(1, text.size() - 2) : text;
}

std::optional<double> NumberFrom(const std::string& text) {
  char* end = nullptr;
  errno = 0;
  const double number = strtod(text.c_str(), &end);
  const bool isWhole = !text.empty() && *end == '\0' && errno == 0 && std::isfinite(number);
  return isWhole ? std::optional<double>(number) : std::nullopt;
}

std::string Shown(double number) {
  std::ostringstream text;
  text << number;
  return text.str();
}

// Returns what is wrong with the value, or an empty text once it is set.
std::string SetSwitch(const std::string& value, bool& target) {
  if (value != "yes" && value != "no") {
    return "is neither yes nor no";
  }
  target = value == "yes";
  return "";
}

std::string SetValue(const Row& row, const std::string& value, Settings& settings) {
  if (const auto* field = std::get_if<bool Settings::*>(&row.field)) {
    return SetSwitch(value, settings.**field);
  }
  const std::optional<double> number = NumberFrom(value);
  if (!number) {
    return "is not a number";
  }
  if (*number < row.least || *number > row.most) {
    return "is not between " + Shown(row.least) + " and " + Shown(row.most);
  }
  if (const auto* field = std::get_if<Duration Settings::*>(&row.field)) {
    settings.** field =
        std::chrono::duration_cast<Duration>(std::chrono::duration<double>(*number));
    return "";
  }
  if (*number != std::floor(*number)) {
    return "is not a whole number";
  }
  settings.*std::get<int64_t Settings::*>(row.field) = static_cast<int64_t>(*number);
  return "";
}

const Row* FindRow(const std::string& key) {
  for (const Row& row : kRows) {
    if (key == row.key) {
      return &row;
    }
  }
  return nullptr;
}

// Returns what is wrong with the line, or an empty text.
std::string TakeLine(const std::string& line, Settings& settings) {
  const size_t sign = line.find('=');
  if (sign == std::string::npos) {
    return "this is no key=value line: " + line;
  }
  const std::string key = Trimmed(line.substr(0, sign));
  const std::string value = Unquoted(Trimmed(line.substr(sign + 1)));
  const Row* row = FindRow(key);
  if (row == nullptr) {
    return "there is no setting of the name " + key;
  }
  const std::string fault = SetValue(*row, value, settings);
  return fault.empty() ? "" : key + "=" + value + " " + fault + "; the default is used";
}

}  // namespace

Settings SettingsFromText(const std::string& text, std::vector<std::string>& complaints) {
  Settings settings;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    line = Trimmed(line);
    if (line.empty() || line[0] == '#' || line[0] == ';') {
      continue;
    }
    const std::string fault = TakeLine(line, settings);
    if (!fault.empty()) {
      complaints.push_back(fault);
    }
  }
  return settings;
}

Settings ReadSettings(const std::string& path, std::vector<std::string>& complaints) {
  errno = 0;
  const std::ifstream file(path, std::ios::binary);
  if (!file) {
    if (errno != ENOENT) {
      complaints.push_back(std::string("cannot be read (") + strerror(errno) +
                           "); the defaults are used");
    }
    return {};
  }
  std::ostringstream text;
  text << file.rdbuf();
  return SettingsFromText(text.str(), complaints);
}

}  // namespace quendeld
