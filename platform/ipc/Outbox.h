// Calls to one client that wait for its connection's thread. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <deque>
#include <optional>

#include "platform/ipc/IPCConnection.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Bounded by number and by memory, because a client that does not read must cost its session only so much.
/// Thread-safe; its lock is a leaf.
class Outbox {
 public:
  /// Bytes that all waiting calls hold together, unless there is only one, which may have
  /// `CodecLimits::content`.
  static constexpr std::size_t kMaximumMemory = std::size_t{4} << 20;

  explicit Outbox(std::size_t maximumCalls) : _maximumCalls(maximumCalls) {}

  /// Null when the call was taken, else why it was not.
  const char* put(IPCOutgoingCall call);
  std::optional<IPCOutgoingCall> take();
  bool empty() const;
  /// Notes that a call which had been taken could not be sent.
  void lose();
  /// Refuses calls from now on and forgets those that wait; returns how many are lost, in all.
  std::size_t close();

 private:
  struct Entry {
    IPCOutgoingCall call;
    std::size_t memory;
  };

  const std::size_t _maximumCalls;
  mutable Mutex _mutex;
  bool _closed VESK_GUARDED_BY(_mutex) = false;
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;
  std::size_t _lost VESK_GUARDED_BY(_mutex) = 0;
  std::deque<Entry> _entries VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
