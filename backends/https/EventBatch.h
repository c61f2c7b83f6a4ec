// The events that an HTTPS backend holds for its next post.
#pragma once

#include <cstddef>
#include <deque>
#include <optional>
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
  ~EventBatch();
  EventBatch(const EventBatch&) = delete;
  EventBatch& operator=(const EventBatch&) = delete;

  void add(MutableDictionary event);

  struct Dropped {
    std::size_t count = 0;
    const HeldAccount* account = nullptr;  ///< the one above its limit; the session's or a wider one
    std::size_t bound = 0;                 ///< bytes that it was held to
  };

  /// Where an account is above its limit, drops the oldest until it is an eighth below; the newest one goes
  /// only for the sake of others than the session.
  Dropped dropOldest();

  /// Adds what is not empty to the events that came before it was known: its first key tells which have it
  /// already. Where an account would come above twice its limit, the older ones are dropped.
  Dropped addUserInfo(const Dictionary& userInfo);

  void setSessionID(const std::optional<Text>& sessionID);

  /// True once: the line about dropped events is written once a batch.
  bool beginsToDrop() noexcept { return !std::exchange(_isDropping, true); }

  std::size_t size() const noexcept { return _events.size(); }
  Events& events() noexcept { return _events; }

 private:
  void dropFront(std::size_t count);

  const HeldBytes _account;
  Events _events;
  bool _isDropping = false;
};

}  // namespace vesk
