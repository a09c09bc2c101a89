// The files of the appliance that a test runs on.
#include "support/appliance.h"

#include <filesystem>
#include <fstream>
#include <sstream>

#include "support/require.h"

namespace quendel::test {

namespace fs = std::filesystem;

void WriteFile(const std::string& path, const std::string& text) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file << text << std::flush;
  Require(file.good(), "cannot write " + path);
}

std::string ReadFile(const std::string& path) {
  const std::ifstream file(path, std::ios::binary);
  Require(file.good(), "cannot read " + path);
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

bool Exists(const std::string& path) {
  return fs::exists(fs::symlink_status(path));
}

void RemoveFile(const std::string& path) {
  fs::remove_all(path);
}

void SetIdentity(const std::map<std::string, std::string>& values) {
  std::string text;
  for (const auto& [key, value] : values) {
    text.append(key).append("=").append(value).append("\n");
  }
  WriteFile("/usr/arvo/etc/device.conf", text);
}

void SetIdentity() {
  SetIdentity({{"serial_number", "S1"},
               {"account_email", "mail1"},
               {"account_field_a", "a1"},
               {"account_field_b", "b2"},
               {"timezone", "Etc/UTC"}});
}

}  // namespace quendel::test
