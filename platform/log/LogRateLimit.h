// Limits how many lines one place in the code may log for one user.
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

/// Admits the first lines of each call site and user in every window and counts the rest, so that one client
/// can't flood the log or suppress the lines of others. Depends only on the times it is given. Thread-safe;
/// holds its lock only for a look-up.
class LogRateLimit {
 public:
  using Time = std::chrono::steady_clock::time_point;

  /// A window begins with its first line. The next one may begin up to a second late.
  static constexpr std::chrono::seconds kWindow{10};
  /// Limit on pairs of site and user within a window. Further pairs share one entry.
  static constexpr std::size_t kMaximumEntries = 4096;

  /// The lines left out in a window that has ended.
  struct LeftOut {
    LogLevel level;
    std::uint32_t user;  ///< LogUser::kNobody for the process itself and for the shared entry
    const char* format;  ///< format of the lines
    std::uint64_t lines;
  };

  struct Verdict {
    bool mayWrite = false;
    std::vector<LeftOut> leftOut{};  ///< to be reported before the line
  };

  /// `lines`: how many lines to admit for each site and user in a window; must not be 0.
  explicit LogRateLimit(std::uint64_t lines) : _lines(lines) {}

  /// Decides about a line of the call at `site`. Its `format` must live as long as the process.
  [[nodiscard]] Verdict admit(const void* site, std::uint32_t user, LogLevel level, const char* format,
                              Time now);
  /// At the end: everything left out that was not reported yet.
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
  Time _nextEnd VESK_GUARDED_BY(_mutex) = Time::max();  ///< end of the next window
};

}  // namespace vesk
