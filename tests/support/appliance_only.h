// For programs that change the machine they run on.
#ifndef TESTS_SUPPORT_APPLIANCE_ONLY_H_
#define TESTS_SUPPORT_APPLIANCE_ONLY_H_

#include <string>

namespace quendel::test {

// Ends the program, unless it runs on a throw-away appliance, with a sentence that names the
// command to start it with.
void EndUnlessOnAppliance(const std::string& command);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_APPLIANCE_ONLY_H_
