// The start of every test program.
#include <gmock/gmock.h>

#include "support/appliance_only.h"

int main(int argc, char** argv) {
  testing::InitGoogleMock(&argc, argv);
  if (!GTEST_FLAG_GET(list_tests)) {
    quendel::test::EndUnlessOnAppliance("script/test SUITE");
  }
  return RUN_ALL_TESTS();
}
