#include <gtest/gtest.h>

#include <cstdlib>

#include "platform/files/RootPrefix.h"
#include "platform/sandbox/SandboxProfile.h"

namespace vesk {
namespace {

TEST(SandboxProfileTest, PutsPathsWhereTheyBelong) {
  setRootPrefix("/prefix");
  ::setenv("VESK_TEST_FILE", "/certificates/ca.pem", 1);
  ::setenv("VESK_TEST_RELATIVE", "certificates", 1);
  ::unsetenv("VESK_TEST_UNSET");
  auto outcome = parseSandboxProfile(R"(
    landlock = "if-available"
    [machine]
    read-if-present = ["$VESK_TEST_FILE", "$VESK_TEST_FILE/..", "$VESK_TEST_RELATIVE/x", "$VESK_TEST_UNSET/x"]
    [root]
    read = ["/etc/x/"]
    sockets = ["/run/x"]
    [calls]
    deny = ["execute", "trace"])");
  setRootPrefix("");
  ASSERT_TRUE(outcome.profile) << outcome.error;
  EXPECT_FALSE(outcome.profile->landlockRequired);
  EXPECT_EQ(outcome.profile->deniedCalls, (std::vector<std::string>{"execute", "trace"}));
  struct {
    const char* path;
    SandboxPath::Access access;
    bool optional;
  } expected[] = {
      {"/certificates/ca.pem", SandboxPath::Access::Read, true},
      {"/certificates", SandboxPath::Access::Read, true},
      {"/prefix/etc/x", SandboxPath::Access::Read, false},
      {"/prefix/run/x", SandboxPath::Access::Sockets, false},
  };
  ASSERT_EQ(outcome.profile->paths.size(), std::size(expected));
  for (std::size_t i = 0; i < std::size(expected); ++i) {
    EXPECT_EQ(outcome.profile->paths[i].path, expected[i].path);
    EXPECT_EQ(outcome.profile->paths[i].access, expected[i].access) << expected[i].path;
    EXPECT_EQ(outcome.profile->paths[i].optional, expected[i].optional) << expected[i].path;
  }
}

TEST(SandboxProfileTest, RefusesWhatItDoesNotKnow) {
  struct {
    const char* profile;
    const char* error;
  } cases[] = {
      {"machine = 1", "machine: must be a table"},
      {"[device]", "device: unknown key"},
      {"[machine]\nraed = [\"/x\"]", "machine.raed: unknown key"},
      {"[machine]\nread = \"/x\"", "machine.read: must be a list of strings"},
      {"[machine]\nread = [1]", "machine.read: must be a list of strings"},
      {"[root]\nwrite = [\"x/y\"]", "root.write: \"x/y\" is no absolute path"},
      {"[calls]\nallow = [\"trace\"]", "calls.allow: unknown key"},
      {"[calls]\ndeny = [\"treason\"]", "calls.deny: unknown group \"treason\""},
  };
  for (const auto& [profile, error] : cases) {
    auto outcome = parseSandboxProfile(profile);
    EXPECT_FALSE(outcome.profile) << profile;
    EXPECT_EQ(outcome.error, error);
  }
}

}  // namespace
}  // namespace vesk
