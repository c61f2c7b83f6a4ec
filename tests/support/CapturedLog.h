// Captures the system log during a test.
#pragma once

#include <algorithm>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/log/SystemLog.h"

namespace vesk::test {

/// Collects the lines of all levels during its lifetime.
class CapturedLog {
 public:
  CapturedLog() {
    SystemLog::setLevel(7);
    SystemLog::setSink([this](LogLevel level, std::string_view line) {
      std::lock_guard lock(_mutex);
      _lines.emplace_back(static_cast<int>(level), std::string(line));
    });
  }
  ~CapturedLog() {
    SystemLog::setSink(nullptr);
    SystemLog::setLevel(6);
  }

  std::vector<std::pair<int, std::string>> lines() const {
    std::lock_guard lock(_mutex);
    return _lines;
  }
  /// How many lines of that level are exactly `line`.
  long count(int level, std::string_view line) const {
    auto all = lines();
    return std::count(all.begin(), all.end(), std::pair<int, std::string>(level, line));
  }
  /// How many lines of that level contain `part`.
  long countContaining(int level, std::string_view part) const {
    auto all = lines();
    return std::count_if(all.begin(), all.end(), [&](const auto& line) {
      return line.first == level && line.second.find(part) != std::string::npos;
    });
  }
  void clear() {
    std::lock_guard lock(_mutex);
    _lines.clear();
  }

 private:
  mutable std::mutex _mutex;
  std::vector<std::pair<int, std::string>> _lines;
};

}  // namespace vesk::test
