#include <gtest/gtest.h>

#include "platform/sandbox/SandboxProfile.h"

namespace vesk {
namespace {

// What a profile grants and denies is tried in sandbox_enter_test.cpp.
TEST(SandboxProfileTest, RequiresLandlockUnlessItSaysOtherwise) {
  EXPECT_TRUE(parseSandboxProfile("").profile->landlockRequired);
  EXPECT_TRUE(parseSandboxProfile("landlock = \"required\"").profile->landlockRequired);
  EXPECT_FALSE(parseSandboxProfile("landlock = \"if-available\"").profile->landlockRequired);
}

TEST(SandboxProfileTest, RefusesWhatItDoesNotKnow) {
  struct {
    const char* profile;
    const char* error;
  } cases[] = {{"machine = 1", "machine: must be a table"},
               {"[device]", "device: unknown key"},
               {"[machine]\nraed = [\"/x\"]", "machine.raed: unknown key"},
               {"[machine]\nread = \"/x\"", "machine.read: must be a list of strings"},
               {"[machine]\nread = [1]", "machine.read: must be a list of strings"},
               {"[root]\nwrite = [\"x/y\"]", "root.write: \"x/y\" is no absolute path"},
               {"[network]\nbind = [1]", "network.bind: unknown key"},
               {"[network]\nconnect = [65536]", "network.connect: must be a list of ports"},
               {"[network]\nconnect = 443", "network.connect: must be a list of ports"},
               {"[calls]\nallow = [\"trace\"]", "calls.allow: unknown key"},
               {"[calls]\ndeny = [\"treason\"]", "calls.deny: unknown group \"treason\""}};
  for (const auto& [profile, error] : cases) {
    auto outcome = parseSandboxProfile(profile);
    EXPECT_FALSE(outcome.profile) << profile;
    EXPECT_EQ(outcome.error, error);
  }
}

}  // namespace
}  // namespace vesk
