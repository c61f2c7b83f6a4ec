// Random client entries for storebags, including combinations that nobody would write.
#pragma once

#include <random>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk::test {

/// Repeatable for a seed.
class RandomEntries {
 public:
  explicit RandomEntries(unsigned seed) : _random(seed) {}

  bool chance(double share) { return std::bernoulli_distribution(share)(_random); }
  double draw() { return std::uniform_real_distribution<double>()(_random); }
  template <class T>
  T oneOf(std::vector<T> all) {
    return all[std::uniform_int_distribution<std::size_t>(0, all.size() - 1)(_random)];
  }

  /// `thresholds`: for sampling. `url`: of posts. `wrong`: values of the wrong type for all keys.
  Dictionary entry(const Value& client, const std::string& url, const std::vector<Value>& thresholds,
                   const std::vector<Value>& wrong = {}) {
    MutableDictionary entry;
    const auto maybe = [&](double share, const char* key, std::vector<Value> values) {
      if (!wrong.empty() && chance(0.05)) values = wrong;
      if (chance(share)) entry.set(key, oneOf(std::move(values)));
    };
    entry.set("client", client);
    maybe(0.1, "service", {"Demo", "Other"});
    maybe(0.9, "locale_whitelist", {List{"US"}, List{"US", "FR"}, List{"US", "FR"}, List{"DE"}, List()});
    maybe(0.3, "device_whitelist", {List{"Phone", "Watch"}, List{"Watch"}, List()});
    maybe(0.3, "override_dnu", {1, 0});
    maybe(0.9, "filters", {List(), List{Dictionary{{"key", "x"}, {"action", "remove"}}}});
    maybe(0.9, "sampling_threshold", thresholds);
    maybe(0.4, "override_sampling", thresholds);
    maybe(0.3, "expedite", {0, 1});
    maybe(0.2, "hierarchy", {0, 1, -1});
    maybe(0.9, "post_url", {url});
    maybe(0.2, "event_threshold", {0, 1, 1000});
    return entry.share();
  }

 private:
  std::mt19937 _random;
};

}  // namespace vesk::test
