// What the test's side of the server does where there is no server.
#include <gtest/gtest.h>

#include "support/server.h"

using namespace quendel::test;

TEST(ServerDeathTest, AsksForARegistrationWithServer) {
  EXPECT_DEATH(Answer({.body = "x"}), "no server: register this test");
  EXPECT_DEATH(Requests(), "no server: register this test");
  EXPECT_DEATH(UseCertificate("expired"), "no server: register this test");
}
