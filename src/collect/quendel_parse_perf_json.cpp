// Turns a series of performance samples into one file per category.
#include <array>
#include <cstdio>
#include <initializer_list>
#include <iterator>
#include <string>
#include <utility>

#include "base/json_text.h"
#include "base/log.h"
#include "quendel/collect.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_parse_perf_json";

constexpr const char* kCategories[] = {"iSCSI", "System", "DiskIO", "SpaceIO", "Network", "Memory"};
constexpr size_t kCategoryCount = std::size(kCategories);

// What each category's file is to hold: null, or an array of samples.
using Figures = std::array<Json::Value, kCategoryCount>;

// Walks down from member to member. Returns the value at the end, or null where a key is missing or
// what should hold it is no object.
const Json::Value* AtPath(const Json::Value& value, std::initializer_list<const char*> keys) {
  const Json::Value* here = &value;
  for (const char* key : keys) {
    here = JsonMember(*here, key);
    if (here == nullptr) {
      break;
    }
  }
  return here;
}

void AddSample(const Json::Value& sample, const char* category, Json::Value& figures) {
  const Json::Value* time = AtPath(sample, {"perf_data", "data", "time"});
  if (time == nullptr) {
    QUENDEL_LOG("Failed to get perf time in json");
    return;
  }
  const Json::Value* data = AtPath(sample, {"perf_data", "data", category});
  if (data == nullptr) {
    QUENDEL_LOG("Failed to ger %s perf object in json", category);  // [sic]
    return;
  }
  Json::Value entry(Json::objectValue);
  entry["time"] = *time;
  entry["data"] = *data;
  figures.append(std::move(entry));
}

// Takes the samples by their numbers, up to the first that the series lacks.
Figures Gather(const Json::Value& series) {
  Figures figures;
  for (int number = 0;; ++number) {
    char key[64];
    snprintf(key, sizeof key, "perf_%d", number);
    const Json::Value* sample = JsonMember(series, key);
    if (sample == nullptr) {
      return figures;
    }
    if (!JsonBool(*sample, "success")) {
      continue;
    }
    for (size_t i = 0; i < kCategoryCount; ++i) {
      AddSample(*sample, kCategories[i], figures[i]);
    }
  }
}

// Returns true when the whole text is in the file and the file is closed.
bool WriteFile(const std::string& path, const std::string& text) {
  FILE* file = fopen(path.c_str(), "we");
  if (file == nullptr) {
    QUENDEL_LOG("Failed to open file '%s'", path.c_str());
    return false;
  }
  const bool written = fputs(text.c_str(), file) != EOF;
  const bool closed = fclose(file) == 0;
  return written && closed;
}

bool WriteCategory(const char* dir, const char* category, const Json::Value& figures) {
  try {
    return WriteFile(std::string(dir) + "/quendel.perf." + category, JsonToText(figures));
  } catch (...) {
    return false;
  }
}

void LogFailedWrite(const char* category) {
  QUENDEL_LOG("Failed to write %s perf data", category);
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELParsePerfJson(const char* dir, const Json::Value& series) try {
  const Figures figures = Gather(series);
  int result = 0;
  for (size_t i = 0; i < kCategoryCount; ++i) {
    if (!WriteCategory(dir, kCategories[i], figures[i])) {
      LogFailedWrite(kCategories[i]);
      result = -1;
    }
  }
  return result;
} catch (...) {
  // There was no memory for the figures, so no file is written.
  for (const char* category : kCategories) {
    LogFailedWrite(category);
  }
  return -1;
}
