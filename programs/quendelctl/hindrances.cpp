// Settings that keep the device from its server.
#include "hindrances.h"

#include <algorithm>
#include <cstdlib>

#include "base/paths.h"
#include "platform/key_value.h"
#include "quendel.h"

namespace quendelctl {
namespace {

constexpr size_t kMostHostBytes = 31;
constexpr char kTwoQuotes[] = "\"\"";

std::string Setting(const char* file, const char* key) {
  char value[4096] = {};
  return ALIBCFileGetKeyValue(file, key, value, sizeof value, 0) > 0 ? value : "";
}

void CheckHost(std::vector<std::string>& found) {
  const std::string host = Setting(quendel::kDefaultsFile, "quendel_server");
  const std::string subject = std::string("quendel_server in ") + quendel::kDefaultsFile;
  if (host == kTwoQuotes) {
    found.push_back(subject + " is read as two quotes; remove the line for the usual server");
  } else if (host.find_first_of("/:") != host.npos) {
    found.push_back(subject + " is more than a host name: " + host);
  }
  if (host.size() > kMostHostBytes) {
    found.push_back(subject + " is longer than 31 characters and is cut: " + host);
  }
}

void CheckContact(std::vector<std::string>& found) {
  if (Setting(quendel::kServiceConfFile, "contact") == kTwoQuotes) {
    found.push_back(std::string("contact in ") + quendel::kServiceConfFile +
                    " is read as two quotes, an empty text; remove the line for no contacts");
  }
}

std::string Variable(const char* name) {
  const char* const value = getenv(name);
  return value == nullptr ? "" : value;
}

// Whether a list of names, each of which stands for all that end in it, has the host.
bool Lists(const std::string& list, const std::string& host) {
  constexpr char kSeparators[] = ", ";
  size_t at = list.find_first_not_of(kSeparators);
  while (at < list.size()) {
    const size_t end = std::min(list.find_first_of(kSeparators, at), list.size());
    const std::string name = list.substr(at, end - at);
    const std::string domain = name[0] == '.' ? name : "." + name;
    const std::string whole = "." + host;
    const size_t rest = whole.size() - std::min(whole.size(), domain.size());
    if (whole.compare(rest, whole.npos, domain) == 0) {
      return true;
    }
    at = list.find_first_not_of(kSeparators, end);
  }
  return list == "*";
}

void CheckProxy(std::vector<std::string>& found) {
  const std::string host = QUENDELGetServerHost();
  if (Lists(Variable("no_proxy"), host) || Lists(Variable("NO_PROXY"), host)) {
    return;
  }
  for (const char* name : {"https_proxy", "HTTPS_PROXY", "all_proxy", "ALL_PROXY"}) {
    if (!Variable(name).empty()) {
      found.push_back(std::string("the variable ") + name +
                      " is set: transfers go by that proxy, and test-connection does not");
    }
  }
}

}  // namespace

std::vector<std::string> FindHindrances() {
  std::vector<std::string> found;
  CheckHost(found);
  CheckContact(found);
  CheckProxy(found);
  return found;
}

}  // namespace quendelctl
