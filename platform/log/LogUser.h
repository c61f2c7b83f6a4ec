// The user on whose behalf a thread works.
#pragma once

#include <cstdint>
#include <utility>

namespace vesk {

/// During its lifetime, lines that this thread logs count as lines of a client's user (see
/// SystemLog::setRateLimit). May be nested. Work that is handed to another thread keeps its user (TimedQueue,
/// HTTPClient).
class LogUser {
 public:
  /// The process itself.
  static constexpr std::uint32_t kNobody = 0xffffffff;

  explicit LogUser(std::uint32_t user) noexcept : _before(std::exchange(_current, user)) {}
  ~LogUser() { _current = _before; }
  LogUser(const LogUser&) = delete;
  LogUser& operator=(const LogUser&) = delete;

  static std::uint32_t current() noexcept { return _current; }

 private:
  static inline thread_local std::uint32_t _current = kNobody;
  const std::uint32_t _before;
};

}  // namespace vesk
