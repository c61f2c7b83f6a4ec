#include <gtest/gtest.h>

#include "util/Counters.h"
#include "util/SamplingDraw.h"

namespace vesk {
namespace {

std::vector<std::tuple<std::string, DropReason, std::uint64_t>> counts(const Counters& counters) {
  std::vector<std::tuple<std::string, DropReason, std::uint64_t>> out;
  for (const auto& count : counters.snapshot()) out.emplace_back(count.backend, count.reason, count.count);
  return out;
}

TEST(Counters, CountByBackendAndReason) {
  Counters counters;
  EXPECT_TRUE(counters.snapshot().empty());
  counters.count("wren", DropReason::NoURL, 5);
  counters.count("httpPost", DropReason::TransportError);
  counters.count("httpPost", DropReason::StateDisabled, 2);
  counters.count("httpPost", DropReason::TransportError);
  EXPECT_EQ(counts(counters), (std::vector<std::tuple<std::string, DropReason, std::uint64_t>>{
                                  {"httpPost", DropReason::StateDisabled, 2},
                                  {"httpPost", DropReason::TransportError, 2},
                                  {"wren", DropReason::NoURL, 5}}));
}

TEST(SamplingDraw, FollowsTheDefaultSequence) {
  // The values of drand48 in a program that never seeds it.
  EXPECT_NEAR(nextSamplingDraw(), 0.0, 1e-9);
  EXPECT_NEAR(nextSamplingDraw(), 0.000985394675650, 1e-12);
  EXPECT_NEAR(nextSamplingDraw(), 0.041631001594613, 1e-12);
}

}  // namespace
}  // namespace vesk
