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
        [](const Dictionary& record) { return integerForKey(record, "number").value_or(0) % 2 == 1; }, {});
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
  EXPECT_EQ(tap.open(all(), {}), nullptr);
  const auto takeAll = [&] {
    DeliveryTap::Batch all;
    for (auto batch = readers[0]->take(0s); !batch.records.empty(); batch = readers[0]->take(0s)) {
      all.records.insert(all.records.end(), batch.records.begin(), batch.records.end());
      all.lost += batch.lost;
    }
    return all;
  };
  const std::string body(DeliveryTap::kBodyBytesPerSecond / 8, 'b');
  const DeliveryTap::Clock::time_point begun{1h};
  for (const int second : {0, 0, 1, 2}) {
    for (int i = 0; i < 5; ++i) tap.tell(numbered(i), body, begun + std::chrono::seconds(second));
  }
  auto records = takeAll().records;
  ASSERT_EQ(records.size(), 20u);
  for (std::size_t i = 0; i < records.size(); ++i)
    EXPECT_EQ(records[i].dictionary()->contains("body"), i < 8) << i << ": no more than 1 MiB wait";
  for (int i = 0; i < 10; ++i) tap.tell(numbered(i), i < 9 ? body : body + body + body, begun + 3s);
  records = takeAll().records;
  for (std::size_t i = 0; i < records.size(); ++i)
    EXPECT_EQ(records[i].dictionary()->contains("body"), i < 8) << i << ": 1 MiB a second";

  for (std::size_t i = 0; i < DeliveryTap::kMostWaiting + 5; ++i) tap.tell(numbered(0));
  const auto all = takeAll();
  EXPECT_EQ(all.records.size(), DeliveryTap::kMostWaiting);
  EXPECT_EQ(all.lost, 5u) << "the reader was too slow";
}

}  // namespace
}  // namespace vesk::test
