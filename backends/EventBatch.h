// The events that an HTTPS backend holds for its next post.
#pragma once

#include <atomic>
#include <cstddef>
#include <deque>
#include <memory>
#include <optional>

#include "platform/values/Value.h"

namespace vesk {

/// Bytes of events that are held back, of all backends of a session.
using HeldBytes = std::shared_ptr<std::atomic<std::size_t>>;

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
  ~EventBatch();
  EventBatch(const EventBatch&) = delete;
  EventBatch& operator=(const EventBatch&) = delete;

  void add(MutableDictionary event);

  /// Drops the oldest while the account is above `bound` bytes, but not the newest; returns how many.
  std::size_t dropOldest(std::size_t bound);

  /// Adds what is not empty to the events that came before it was known: its first key tells which have it
  /// already. Where the account would come above `bound`, the older ones are dropped; returns how many.
  std::size_t addUserInfo(const Dictionary& userInfo, std::size_t bound);

  void setSessionID(const std::optional<Text>& sessionID);

  std::size_t size() const noexcept { return _events.size(); }
  Events& events() noexcept { return _events; }

 private:
  void dropFront(std::size_t count);

  const HeldBytes _account;
  Events _events;
};

}  // namespace vesk
