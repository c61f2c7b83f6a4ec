// The events that an HTTPS backend holds for its next post.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>

#include <VeskReporting/values/Value.h>
#include "backends/HeldBytes.h"

namespace vesk {

/// Oldest first. Its events count in the session's account from when they are added until they are dropped or
/// the batch is destroyed. Not thread-safe, except for the account.
class EventBatch {
 public:
  struct HeldEvent {
    MutableDictionary event;
    std::size_t bytes = 0;  ///< approximate memory
  };
  using Events = std::deque<HeldEvent>;

  explicit EventBatch(HeldBytes account) : _account(std::move(account)) {}
  EventBatch(HeldBytes account, MutableDictionary only) : EventBatch(std::move(account)) {
    add(std::move(only));
  }
  ~EventBatch();
  EventBatch(const EventBatch&) = delete;
  EventBatch& operator=(const EventBatch&) = delete;

  void add(MutableDictionary event);
  /// As above, and also counts the event for its method.
  void add(MutableDictionary event, std::int64_t method);
  /// Returns true if the batch holds more events of the method than `threshold`, then restarts their count.
  bool passesThreshold(std::int64_t method, std::int32_t threshold);

  /// If an account is above its limit, drops the oldest events until it is an eighth below. Drops the newest
  /// event only for the sake of an account other than the session's. Returns the number dropped. Here and
  /// below, the first drop is logged at level 4.
  std::size_t dropOldest(const std::string& backendName);

  /// Adds non-empty user info to the events that were added before it was known; its first key shows which
  /// events already have it. If an account would exceed twice its limit, drops the older events. Returns the
  /// number dropped.
  std::size_t addUserInfo(const Dictionary& userInfo, const std::string& backendName);

  void setSessionID(const std::optional<Text>& sessionID);

  std::size_t size() const noexcept { return _events.size(); }
  Events& events() noexcept { return _events; }

 private:
  void dropFront(std::size_t count);
  void logDropped(const HeldAccount& account, std::size_t bound, const std::string& backendName);

  const HeldBytes _account;
  Events _events;
  std::unordered_map<std::int64_t, std::int32_t> _eventMethodCounts;
  bool _hasLoggedDrop = false;
};

}  // namespace vesk
