// What operators who look at deliveries get, and that they cost the others nothing they notice.
#include <gtest/gtest.h>

#include "util/DeliveryTap.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

DeliveryTap::Filter all() {
  return [](const Dictionary&) { return true; };
}
Dictionary numbered(int number) { return Dictionary{{"number", number}}; }

TEST(DeliveryTap, GivesEachReaderWhatItAsksFor) {
  DeliveryTap tap;
  EXPECT_FALSE(tap.isOpen());
  {
    auto odd = tap.open(
        [](const Dictionary& record) { return integerForKey(record, "number").value_or(0) % 2 == 1; });
    auto every = tap.open(all(), {.messages = true, .bodies = true});
    EXPECT_TRUE(tap.isOpen() && tap.wantsMessages() && tap.wantsBodies());
    for (int i = 0; i < 4; ++i) tap.tell(numbered(i), "body");
    EXPECT_EQ(odd->take(0s).records, (std::vector<Value>{numbered(1), numbered(3)}));
    const auto records = every->take(0s).records;
    ASSERT_EQ(records.size(), 4u);
    EXPECT_EQ(records[3].dictionary()->text("body")->string(), "body");
    EXPECT_TRUE(every->take(0s).records.empty());
  }
  EXPECT_FALSE(tap.isOpen() || tap.wantsMessages() || tap.wantsBodies());
}

TEST(DeliveryTap, HasLimits) {
  DeliveryTap tap;
  std::vector<std::shared_ptr<DeliveryTap::Reader>> readers;
  for (std::size_t i = 0; i < DeliveryTap::kMostReaders; ++i)
    readers.push_back(tap.open(all(), {.bodies = true}));
  EXPECT_EQ(tap.open(all()), nullptr);
  const std::string body(DeliveryTap::kBodyBytesPerSecond / 8, 'b');
  const DeliveryTap::Clock::time_point begun{1h};
  for (int i = 0; i < 10; ++i) tap.tell(numbered(i), body, begun);
  tap.tell(numbered(10), body, begun + 1s);
  for (int i = 11; i < static_cast<int>(DeliveryTap::kMostWaiting) + 5; ++i) tap.tell(numbered(i));
  std::vector<Value> records;
  for (auto batch = readers[0]->take(0s); !batch.records.empty(); batch = readers[0]->take(0s)) {
    EXPECT_EQ(batch.lost, records.empty() ? 5u : 0u) << "the reader was too slow";
    records.insert(records.end(), batch.records.begin(), batch.records.end());
  }
  ASSERT_EQ(records.size(), DeliveryTap::kMostWaiting);
  for (std::size_t i = 0; i < 12; ++i)
    EXPECT_EQ(records[i].dictionary()->contains("body"), i < 8 || i == 10) << i << ": 1 MiB a second";
}

}  // namespace
}  // namespace vesk::test
