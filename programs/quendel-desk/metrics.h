// What the desk counts, in the text form of Prometheus.
#ifndef QUENDEL_DESK_METRICS_H_
#define QUENDEL_DESK_METRICS_H_

#include <string>

#include "access_log.h"

namespace quendeldesk {

void CountRequest(const AccessLine& line);

struct Gauges {
  size_t connections = 0;
  uint64_t free_bytes = 0;
  long long devices = 0;
  long long open_actions = 0;
};
std::string MetricsText(const Gauges& gauges);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_METRICS_H_
