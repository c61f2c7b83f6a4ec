// How evenly the backlogs of many devices return to a server after an outage, with the outbox's own policy.
// Usage: herd [DEVICES]     (100,000 by default)
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <random>
#include <vector>

#include "platform/outbox/HostBackoff.h"

namespace {

using namespace std::chrono_literals;
using Instant = vesk::HostBackoff::Instant;

constexpr auto kBin = 10s;
constexpr auto kMeanOver = 15min;
// Each device's first post fails within this time after the outage begins.
constexpr double kFirstFailureWithin = 60;

/// The time of the first attempt after the outage.
Instant returnOfOne(Instant end, std::minstd_rand& generator) {
  std::uniform_real_distribution<double> random;
  vesk::HostBackoff backoff;
  const auto first = std::chrono::duration_cast<vesk::HostBackoff::Duration>(
      std::chrono::duration<double>(kFirstFailureWithin * random(generator)));
  for (backoff.begin(Instant{} + first, random(generator)); backoff.next() < end;) {
    backoff.failed(backoff.next(), random(generator));
  }
  return backoff.next();
}

/// Prints the highest rate of returns, relative to the mean over the 15 minutes after the outage. Returns
/// true if it is at most twice the mean.
bool simulate(const char* name, std::chrono::seconds outage, std::size_t devices,
              std::minstd_rand& generator) {
  const Instant end = Instant{} + outage;
  std::vector<std::size_t> bins;
  std::vector<std::chrono::seconds> waits;
  for (std::size_t i = 0; i < devices; ++i) {
    const auto wait = std::chrono::duration_cast<std::chrono::seconds>(returnOfOne(end, generator) - end);
    waits.push_back(wait);
    const auto bin = static_cast<std::size_t>(wait / kBin);
    bins.resize(std::max(bins.size(), bin + 1));
    ++bins[bin];
  }
  std::nth_element(waits.begin(), waits.begin() + static_cast<std::ptrdiff_t>(waits.size() / 2), waits.end());
  const double mean = static_cast<double>(devices) * (kBin / 1.0s) / (kMeanOver / 1.0s);
  const double peak = static_cast<double>(*std::max_element(bins.begin(), bins.end())) / mean;
  std::printf("outage of %-10s  peak %.2f times the mean, median return after %lld s, last after %lld s\n",
              name, peak, static_cast<long long>(waits[waits.size() / 2].count()),
              static_cast<long long>((bins.size() * kBin).count()));
  return peak <= 2;
}

}  // namespace

int main(int argc, char** argv) {
  const std::size_t devices = argc > 1 ? std::strtoul(argv[1], nullptr, 10) : 100'000;
  if (devices == 0) {
    std::fprintf(stderr, "usage: herd [DEVICES]\n");
    return 2;
  }
  std::minstd_rand generator(1);
  bool isGood = simulate("10 minutes", 10min, devices, generator);
  isGood = simulate("1 hour", 1h, devices, generator) && isGood;
  isGood = simulate("12 hours", 12h, devices, generator) && isGood;
  return isGood ? 0 : 1;
}
