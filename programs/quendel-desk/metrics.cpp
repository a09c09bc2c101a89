// What the desk counts, in the text form of Prometheus.
#include "metrics.h"

#include <map>
#include <mutex>
#include <sstream>
#include <tuple>

namespace quendeldesk {
namespace {

struct Count {
  uint64_t requests = 0;
  uint64_t bytes = 0;
  double seconds = 0;
};
using Labels = std::tuple<std::string, std::string, int>;  // path, result, code

std::mutex mutex;
std::map<Labels, Count> counts;

// The first piece of the path, of those there are: anybody can make up others.
std::string PathOf(const std::string& target) {
  for (const char* path : {"heartbeat", "action_progress", "action", "collect", "upload_file"}) {
    const std::string start = "/" + std::string(path) + "/";
    if (target.compare(0, start.size(), start) == 0) {
      return path;
    }
  }
  return target.compare(0, 8, "/api/v1/") == 0 ? "api" : "other";
}

void Head(std::ostream& out, const char* name, const char* type, const char* help) {
  out << "# HELP quendel_desk_" << name << " " << help << "\n# TYPE quendel_desk_" << name << " "
      << type << "\n";
}

template <typename Value>
void Gauge(std::ostream& out, const char* name, const char* help, Value value) {
  Head(out, name, "gauge", help);
  out << "quendel_desk_" << name << " " << value << "\n";
}

template <typename Member>
void Counter(std::ostream& out, const char* name, const char* help, Member member) {
  Head(out, name, "counter", help);
  for (const auto& [labels, count] : counts) {
    const auto& [path, result, code] = labels;
    out << "quendel_desk_" << name << "{path=\"" << path << "\",result=\"" << result << "\",code=\""
        << code << "\"} " << count.*member << "\n";
  }
}

}  // namespace

void CountRequest(const AccessLine& line) {
  const std::string result = line.cut ? "cut" : std::to_string(line.status);
  const std::lock_guard<std::mutex> lock(mutex);
  Count& count = counts[{PathOf(line.target), result, line.code}];
  ++count.requests;
  count.bytes += line.received;
  count.seconds += std::chrono::duration<double>(line.duration).count();
}

std::string MetricsText(const Gauges& gauges) {
  std::ostringstream out;
  const std::lock_guard<std::mutex> lock(mutex);
  Counter(out, "requests_total", "Requests that ended.", &Count::requests);
  Counter(out, "received_bytes_total", "Bytes of their bodies.", &Count::bytes);
  Counter(out, "request_seconds_total", "Time that they took.", &Count::seconds);
  Gauge(out, "connections", "Open connections.", gauges.connections);
  Gauge(out, "free_bytes", "Free space where files are kept.", gauges.free_bytes);
  Gauge(out, "devices", "Devices that are known.", gauges.devices);
  Gauge(out, "open_actions", "Actions that wait for their devices.", gauges.open_actions);
  return out.str();
}

}  // namespace quendeldesk
