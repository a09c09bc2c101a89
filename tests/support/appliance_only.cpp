// For programs that change the machine they run on.
#include "support/appliance_only.h"

#include <errno.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

namespace quendel::test {

void EndUnlessOnAppliance(const std::string& command) {
  // tools/appliance/run makes this folder.
  if (access("/run/appliance", F_OK) == 0) {
    return;
  }
  fprintf(stderr,
          "%s changes the machine that it runs on, so it runs on a throw-away appliance only: %s\n",
          program_invocation_short_name, command.c_str());
  exit(1);
}

}  // namespace quendel::test
