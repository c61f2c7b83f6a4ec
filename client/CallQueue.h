// Where calls wait for the session's thread.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>
#include <poll.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <optional>

#include "client/ClientCall.h"
#include "platform/files/GuardedDescriptor.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Why a call was not sent: as in ReportingDrops.
enum class Drop { QueueFull, Invalid, Unsent };

/// Bounded queue from any thread to one, with the count of what was dropped. Putting a call in takes a short
/// lock, and costs a system call only when the receiving thread sleeps and asked to be woken for it.
class CallQueue {
 public:
  using Time = ClientCall::Time;
  /// What the receiving thread asks to be woken for.
  enum class WakeFor { NothingQueued, AnsweredCalls, EveryCall };

  /// Throws std::system_error when no descriptor is left.
  explicit CallQueue(const ReportingOptions& options);

  // For any thread.

  /// Queued, QueueFull or Closed. Connection requests need no room. Throws std::bad_alloc, and then nothing
  /// was queued.
  ReportingStatus push(ClientCall&& call);
  /// No call gets in any more; the receiving thread is to end by `drainDeadline`.
  void close(Time drainDeadline) noexcept;
  void countDrop(Drop reason) noexcept { ++_drops[static_cast<std::size_t>(reason)]; }
  /// Takes no lock, so that a process forked from this one may ask.
  ReportingDrops drops() const noexcept { return {_drops[0], _drops[1], _drops[2]}; }

  // The receiving thread's side.

  /// False once the host has closed the queue's descriptors: it can't wake its thread any more.
  bool ownsItsDescriptors() const noexcept { return _readEnd.isOurs() && _writeEnd.isOurs(); }
  /// Appends everything queued to `calls`, where it goes on to count against the bounds, and what asks for
  /// the connection to `requests`; lowers `firstDeadline` to theirs. True when a burst of drops has begun,
  /// which deserves a log line.
  bool take(ClientCalls& calls, ClientCalls& requests, Time& firstDeadline) noexcept;
  /// Calls taken earlier have left, as the last ones or not: their room is free again, and the nodes of
  /// those that are `emptied` are used again.
  void leave(std::size_t calls, std::size_t memory, bool wereLast, ClientCalls&& emptied = {}) noexcept;
  /// Set once the queue is closed.
  std::optional<Time> drainDeadline() const noexcept;
  /// Waits for `other`, for a push of `what`, or until `wait` is over. Whether `other` is ready.
  bool sleep(WakeFor what, ClientCall::Time::duration wait, pollfd other) noexcept;

 private:
  void wake() noexcept;

  const std::size_t _maximumCalls;
  const std::size_t _maximumMemory;
  // Sockets, which unlike an eventfd have an identity.
  GuardedDescriptor _readEnd;
  GuardedDescriptor _writeEnd;

  std::atomic<std::uint64_t> _drops[3] = {};

  mutable Mutex _mutex;
  std::size_t _calls VESK_GUARDED_BY(_mutex) = 0;   ///< queued, or taken and not left yet
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;  ///< theirs
  bool _isBurst VESK_GUARDED_BY(_mutex) = false;    ///< of drops
  ClientCalls _queued VESK_GUARDED_BY(_mutex);
  ClientCalls _requests VESK_GUARDED_BY(_mutex);
  ClientCalls _spare VESK_GUARDED_BY(_mutex);                 ///< empty
  Time _firstDeadline VESK_GUARDED_BY(_mutex) = Time::max();  ///< of the answers that those want
  WakeFor _wakeFor VESK_GUARDED_BY(_mutex) = WakeFor::NothingQueued;
  bool _mustTellOfBurst VESK_GUARDED_BY(_mutex) = false;
  std::optional<Time> _drainDeadline VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
