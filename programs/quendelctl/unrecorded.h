// What a collection run delivered and did not record as collected.
#ifndef QUENDELCTL_UNRECORDED_H_
#define QUENDELCTL_UNRECORDED_H_

#include <string>
#include <vector>

#include "run_watch.h"

namespace quendelctl {

struct Unrecorded {
  std::string name;    // the collector's, in its settings file
  std::string reason;  // in words that go on "as ..."
};

// Compares what a complete run has gathered with the state that it staged, and that with the
// collectors' settings files. Look before another run starts: that one stages anew.
std::vector<Unrecorded> FindUnrecorded(const RunWatch& run);

}  // namespace quendelctl

#endif  // QUENDELCTL_UNRECORDED_H_
