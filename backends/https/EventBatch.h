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

/// Oldest first. What its events take is part of the session's account from when they are added until they
/// are dropped or the batch is destroyed. Not thread-safe, but for the account.
class EventBatch {
 public:
  struct HeldEvent {
    MutableDictionary event;
    std::size_t bytes = 0;  ///< about what it takes of memory
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
  /// The same, and counts the event among those of its method.
  void add(MutableDictionary event, std::int64_t method);
  /// True when there are more events of the method than that; their count then starts again.
  bool passesThreshold(std::int64_t method, std::int32_t threshold);

  /// Where an account is above its limit, drops the oldest until it is an eighth below; the newest one goes
  /// only for the sake of others than the session. Returns how many it dropped; the first time there is a
  /// line of level 4, here and below.
  std::size_t dropOldest(const std::string& backendName);

  /// Adds what is not empty to the events that came before it was known: its first key tells which have it
  /// already. Where an account would come above twice its limit, the older ones are dropped. Returns how
  /// many.
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
