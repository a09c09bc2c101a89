// For programs that change the machine they run on.
#ifndef SUPPORT_APPLIANCE_ONLY_H_
#define SUPPORT_APPLIANCE_ONLY_H_

#include <string>

namespace quendel::test {

// Ends the program, unless it runs on a throw-away appliance, with a sentence that names the
// command to start it with.
void EndUnlessOnAppliance(const std::string& command);

}  // namespace quendel::test

#endif  // SUPPORT_APPLIANCE_ONLY_H_
