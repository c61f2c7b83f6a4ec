// The filters of a storebag's client entry: they remove or digest values before an event leaves the device.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// One compiled filter.
struct filterTag {
  enum Action : std::int32_t { Leave = 0, Remove = 1, Digest = 2 };

  std::int32_t method = -1;  ///< event method to which it applies; negative: any
  std::int32_t status = -1;  ///< event status to which it applies; negative: any
  std::int32_t action = Leave;
  std::optional<Text> key;  ///< compared ignoring case; without a key, matches nothing
  bool keyIsASCII = false;
};

/// A table of filters, in the storebag's order. Not thread-safe: protected by its backend.
class EventFilters {
 public:
  EventFilters() = default;

  /// Replaces the table with one record per element; an empty array leaves the table unchanged. `backendName`
  /// appears in the log lines about unreadable filters.
  void createFiltersFromArray(const List& filters, std::string_view backendName);

  /// Applies the table in place. The first record that matches a key decides about that key.
  void filterEvent(MutableDictionary& event) const;

 private:
  const filterTag* decidingFilter(const Text& key, std::int32_t method, std::int32_t status) const;

  std::vector<filterTag> _filters;
};

}  // namespace vesk
