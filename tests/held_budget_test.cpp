// The memory of held events, shared by sessions and users.
#include <gtest/gtest.h>

#include "session/BackendSet.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

TEST(HeldBudget, ASessionPaysWithItsOwnEvents) {
  testRoot().write("etc/veskreporting/device.toml", "DeviceName = \"Phone\"\n");
  BackendHarness harness;
  harness.services.heldBudget = std::make_shared<HeldBudget>(
      HeldBudget::Limits{.ofSession = 1 << 20, .ofUser = 2 << 20, .ofAll = 3 << 20});
  // Each event takes slightly more than a tenth of a MiB.
  const Dictionary payload{{"bulk", std::string(100 << 10, 'x')}};
  const std::string of = "HTTPSPostBackend(batchEvent): ";
  const std::string ofBackend = ": dropping the oldest events of backend httpPost";
  const std::tuple<const char*, uid_t, int, std::uint64_t, std::string> cases[] = {
      {"within its own limit", 1, 9, 0, ""},
      {"above it", 1, 11, 3,
       of + "backend httpPost holds more than 1048576 bytes: dropping its oldest events"},
      {"its user's is used up", 1, 9, 8, of + "user 1 holds more than 2097152 bytes" + ofBackend},
      {"another user's is not", 2, 9, 0, ""},
      {"all is used up", 3, 9, 8, of + "the daemon holds more than 3145728 bytes" + ofBackend}};
  std::vector<BackendSet> sessions;
  for (const auto& [what, user, events, dropped, line] : cases) {
    SCOPED_TRACE(what);
    CapturedLog log;
    const std::uint64_t before = harness.dropped(DropReason::OverBound);
    sessions.push_back(createBackends(Dictionary{{"httpPost", Dictionary{{"clients", List{}}}}}, Dictionary(),
                                      std::nullopt, "", "7.0", {user}, harness.services)
                           .value());
    for (int i = 0; i < events; ++i) sessions.back().at(0).second->sendMessage(payload, timeval{}, 3, 2, 0);
    EXPECT_EQ(harness.dropped(DropReason::OverBound) - before, dropped);
    EXPECT_EQ(log.countContaining(4, ""), line.empty() ? 0 : 1);
    EXPECT_EQ(log.count(4, line), line.empty() ? 0 : 1);
  }
  sessions.clear();
  EXPECT_EQ(harness.services.heldBudget->accountFor(1)->exceeded(1 << 20), nullptr) << "given back";
}

}  // namespace
}  // namespace vesk::test
