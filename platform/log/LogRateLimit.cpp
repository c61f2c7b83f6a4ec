#include "platform/log/LogRateLimit.h"

#include <algorithm>

#include "platform/log/LogUser.h"

namespace vesk {

namespace {

// The minimum interval between two passes over all entries.
constexpr std::chrono::seconds kLeastPause{1};

}  // namespace

LogRateLimit::Verdict LogRateLimit::admit(const void* site, std::uint32_t user, LogLevel level,
                                          const char* format, Time now) {
  Verdict verdict;
  MutexLock lock(_mutex);
  if (now >= _nextEnd) {
    endWindows(now, verdict.leftOut);
    _nextEnd = std::max(_nextEnd, now + kLeastPause);
  }
  Key key{site, user};
  if (_entries.size() >= kMaximumEntries && !_entries.contains(key)) {
    key = {nullptr, LogUser::kNobody};
    format = "…";
  }
  auto [entry, isNew] = _entries.try_emplace(key, Entry{now, level, format});
  if (isNew) _nextEnd = std::min(_nextEnd, now + kWindow);
  verdict.mayWrite = ++entry->second.lines <= _lines;
  return verdict;
}

std::vector<LogRateLimit::LeftOut> LogRateLimit::takeAll() {
  std::vector<LeftOut> leftOut;
  MutexLock lock(_mutex);
  endWindows(Time::max(), leftOut);
  return leftOut;
}

/// Removes the windows that have ended by `until`.
void LogRateLimit::endWindows(Time until, std::vector<LeftOut>& leftOut) {
  _nextEnd = Time::max();
  for (auto next = _entries.begin(); next != _entries.end();) {
    const auto at = next++;
    const Entry& entry = at->second;
    if (until - kWindow < entry.begun) {
      _nextEnd = std::min(_nextEnd, entry.begun + kWindow);
      continue;
    }
    if (entry.lines > _lines) {
      leftOut.push_back({entry.level, at->first.second, entry.format, entry.lines - _lines});
    }
    _entries.erase(at);
  }
}

}  // namespace vesk
