// Decides by its optional signed keys whether a verified storebag may be used.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"
#include "platform/sync/Mutex.h"
#include "platform/time/Clock.h"

namespace vesk {

/// In whole seconds, within the years 1970 to 9999.
WallTime wallTimeAt(const Date& date);

/// A storebag's payload may have the keys `name` (its own name; protects against another one's document),
/// `serial` (an integer from 0 that never falls; against an old document) and `expires` (a date). Remembers
/// the accepted ones for the life of the process. Thread-safe.
class StorebagAcceptance {
 public:
  /// `isClockSet`: whether the wall clock can be trusted. While it can't, nothing expires.
  StorebagAcceptance(const WallClock& clock, std::function<bool()> isClockSet)
      : _clock(clock), _isClockSet(std::move(isClockSet)) {}

  /// Accepts the payload of a document that was fetched or kept under that name, or returns the reason
  /// against it.
  Result<void> accept(std::string_view name, const Dictionary& payload);

  /// The built-in storebag is in force under that name, and does not expire. The highest serial stays.
  void usesBuiltIn(std::string_view name);

  /// Whether the storebag of that name that was accepted last has expired. Logs it once.
  bool hasExpired(std::string_view name);

 private:
  struct Accepted {
    std::int64_t serial = 0;
    std::optional<WallTime> expires{};
    bool isExpiryLogged = false;
  };
  bool isPast(std::optional<WallTime> time) const;

  const WallClock& _clock;
  const std::function<bool()> _isClockSet;
  Mutex _mutex;
  std::map<std::string, Accepted, std::less<>> _accepted VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
