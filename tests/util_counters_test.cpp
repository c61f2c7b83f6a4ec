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

TEST(Counters, PutNamesBeyondTheBoundTogether) {
  Counters counters;
  for (int i = 0; i < 100; ++i) counters.count(std::to_string(i), DropReason::OverBound);
  EXPECT_EQ(counters.snapshot().size(), 65u);
  EXPECT_EQ(counts(counters).back(),
            std::make_tuple(std::string("other"), DropReason::OverBound, std::uint64_t{36}));
  counters.count("63", DropReason::OverBound);
  EXPECT_EQ(counters.snapshot().size(), 65u);
}

TEST(Counters, HaveANameForEveryReason) {
  const std::string_view names[] = {
      "state-disabled",    "transport-error", "no-url",       "server-error-5xx", "over-bound",
      "body-not-built",    "invalid-message", "no-backend",   "upload-failed",    "never-enabled",
      "unacknowledged",    "not-aggregated",  "not-recorded", "adaptor-failed",   "server-refused",
      "deferred",          "delivered-late",  "refused",      "expired",          "over-quota",
      "consent-withdrawn", "damaged",         "not-written",
  };
  ASSERT_EQ(std::size(names), kDropReasonCount);
  for (std::size_t i = 0; i <= kDropReasonCount; ++i)
    EXPECT_EQ(nameOfDropReason(static_cast<DropReason>(i)), i < kDropReasonCount ? names[i] : "unknown");
}

TEST(SamplingDraw, FollowsTheDefaultSequence) {
  // The values of drand48 in a program that never seeds it.
  EXPECT_NEAR(nextSamplingDraw(), 0.0, 1e-9);
  EXPECT_NEAR(nextSamplingDraw(), 0.000985394675650, 1e-12);
  EXPECT_NEAR(nextSamplingDraw(), 0.041631001594613, 1e-12);
}

}  // namespace
}  // namespace vesk
