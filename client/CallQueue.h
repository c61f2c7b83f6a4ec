// The queue of calls for the session's thread.
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

/// Why a call was not sent; same as in ReportingDrops.
enum class Drop { QueueFull, Invalid, Unsent };

/// A bounded queue from any thread to one, which counts dropped calls. Pushing takes a short lock, and costs
/// a system call only if the receiving thread sleeps and asked to be woken for the call.
class CallQueue {
 public:
  using Time = ClientCall::Time;
  /// Which calls wake the receiving thread.
  enum class WakeFor { NothingQueued, AnsweredCalls, EveryCall };

  /// Throws std::system_error if no descriptor is left.
  explicit CallQueue(const ReportingOptions& options);

  // Thread-safe.

  /// Returns Queued, QueueFull or Closed. Connection requests need no room. If it throws, nothing
  /// was queued.
  ReportingStatus push(ClientCall&& call);
  /// Refuses further calls; the receiving thread must end by `drainDeadline`.
  void close(Time drainDeadline) noexcept;
  void countDrop(Drop reason) noexcept { ++_drops[static_cast<std::size_t>(reason)]; }
  /// Takes no lock, so it may be called in a process forked from this one.
  ReportingDrops drops() const noexcept { return {_drops[0], _drops[1], _drops[2]}; }

  // Only for the receiving thread.

  /// Returns false once the host has closed the queue's descriptors; it can then no longer wake its thread.
  bool ownsItsDescriptors() const noexcept { return _readEnd.isOurs() && _writeEnd.isOurs(); }
  /// Appends queued calls to `calls`, where they still count against the limits, and connection requests to
  /// `requests`. Lowers `firstDeadline` to their earliest deadline. Returns true if a burst of drops has
  /// begun, which should be logged.
  bool take(ClientCalls& calls, ClientCalls& requests, Time& firstDeadline) noexcept;
  /// Frees the room of calls that were taken earlier. `wereLast`: no taken calls are left. The nodes of the
  /// `emptied` calls are reused.
  void leave(std::size_t calls, std::size_t memory, bool wereLast, ClientCalls&& emptied = {}) noexcept;
  /// Set when the queue is closed.
  std::optional<Time> drainDeadline() const noexcept;
  /// Waits until `other` is ready, a call that matches `what` is pushed, or `wait` has passed. Returns
  /// whether `other` is ready.
  bool sleep(WakeFor what, ClientCall::Time::duration wait, pollfd other) noexcept;

 private:
  void wake() noexcept;

  const std::size_t _maximumCalls;
  const std::size_t _maximumMemory;
  // Sockets, because unlike an eventfd they have an identity.
  GuardedDescriptor _readEnd;
  GuardedDescriptor _writeEnd;

  std::atomic<std::uint64_t> _drops[3] = {};

  mutable Mutex _mutex;
  std::size_t _calls VESK_GUARDED_BY(_mutex) = 0;   ///< queued, or taken and not yet left
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;  ///< of those calls
  bool _isBurst VESK_GUARDED_BY(_mutex) = false;    ///< of drops
  ClientCalls _queued VESK_GUARDED_BY(_mutex);
  ClientCalls _requests VESK_GUARDED_BY(_mutex);
  ClientCalls _spare VESK_GUARDED_BY(_mutex);                 ///< empty nodes for reuse
  Time _firstDeadline VESK_GUARDED_BY(_mutex) = Time::max();  ///< earliest deadline of the queued calls
  WakeFor _wakeFor VESK_GUARDED_BY(_mutex) = WakeFor::NothingQueued;
  bool _mustTellOfBurst VESK_GUARDED_BY(_mutex) = false;
  std::optional<Time> _drainDeadline VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
