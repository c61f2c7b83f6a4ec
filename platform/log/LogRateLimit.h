// How many lines a place in the code may log for a user.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <utility>
#include <vector>

#include "platform/log/LogLevel.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Lets the first lines of each call site and user through in every window, and counts the rest, so that a
/// client's flood neither fills the log nor silences anybody else's lines. A function of the times that it is
/// given. Thread-safe; its lock is held for a look-up only.
class LogRateLimit {
 public:
  using Time = std::chrono::steady_clock::time_point;

  /// A window begins with its first line; the next one may begin up to a second late.
  static constexpr std::chrono::seconds kWindow{10};
  /// Sites times users that logged within a window. Those in excess share one entry.
  static constexpr std::size_t kMaximumEntries = 4096;

  /// What was left out in a window that is over.
  struct LeftOut {
    LogLevel level;
    std::uint32_t user;  ///< LogUser::kNobody for the process itself and for those in excess
    const char* format;  ///< of the lines
    std::uint64_t lines;

    friend bool operator==(const LeftOut&, const LeftOut&) = default;
  };

  struct Verdict {
    bool mayWrite = false;
    std::vector<LeftOut> leftOut{};  ///< to be told before the line
  };

  /// `lines`: for each site and user in a window, more than 0.
  explicit LogRateLimit(std::uint64_t lines) : _lines(lines) {}

  /// A line of the call at `site`, which has a `format` that lives as long as the process.
  [[nodiscard]] Verdict admit(const void* site, std::uint32_t user, LogLevel level, const char* format,
                              Time now);
  /// At the end: all that was left out and not told yet.
  [[nodiscard]] std::vector<LeftOut> takeAll();

 private:
  using Key = std::pair<const void*, std::uint32_t>;
  struct Entry {
    Time begun;
    LogLevel level;
    const char* format;
    std::uint64_t lines = 0;
  };
  using Entries = std::map<Key, Entry>;

  void endWindows(Time until, std::vector<LeftOut>& leftOut) VESK_REQUIRES(_mutex);

  const std::uint64_t _lines;
  Mutex _mutex;
  Entries _entries VESK_GUARDED_BY(_mutex);
  Time _nextEnd VESK_GUARDED_BY(_mutex) = Time::max();  ///< of a window
};

}  // namespace vesk
