// Where calls wait for the session's thread.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <cstddef>
#include <vector>

#include "client/ClientCall.h"
#include "platform/files/GuardedDescriptor.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Bounded queue from any thread to one. Putting a call in takes a short lock, and costs a system call only
/// when the receiving thread sleeps and asked to be woken for it.
class CallQueue {
 public:
  /// What the receiving thread asks to be woken for.
  enum class WakeFor { NothingQueued, AnsweredCalls, EveryCall };

  CallQueue(std::size_t maximumCalls, std::size_t maximumMemory) noexcept;

  /// False when no descriptor was left to make the queue with.
  bool isUsable() const noexcept { return _readEnd && _writeEnd; }
  /// False once the host has closed the queue's descriptors: it can't wake its thread any more.
  bool ownsItsDescriptors() const noexcept { return _readEnd.isOurs() && _writeEnd.isOurs(); }

  /// Queued, QueueFull or Closed. Throws std::bad_alloc, and then nothing was queued.
  ReportingStatus push(ClientCall&& call);

  /// Wakes the receiving thread, whatever it asked for.
  void wake() noexcept;
  /// No call gets in any more; wakes the receiving thread.
  void close() noexcept;

  // The receiving thread's side.

  /// Moves everything queued to `calls`, which must be empty. It goes on to count against the bounds.
  void takeAll(std::vector<ClientCall>& calls) noexcept;
  /// Calls taken earlier have left: their room is free again.
  void leave(std::size_t calls, std::size_t memory) noexcept;
  /// Says what a push from now on has to wake for. False when such a call is queued already: don't sleep.
  bool prepareToSleep(WakeFor what) noexcept;
  /// Readable once something has woken the thread, or the host has closed the other end.
  int descriptor() const noexcept { return _readEnd.get(); }
  /// After waking: pushes need not wake any more, and the descriptor is quiet again.
  void awake(bool descriptorIsReadable) noexcept;

 private:
  const std::size_t _maximumCalls;
  const std::size_t _maximumMemory;
  // Sockets, which unlike an eventfd have an identity.
  GuardedDescriptor _readEnd;
  GuardedDescriptor _writeEnd;

  Mutex _mutex;
  std::vector<ClientCall> _queued VESK_GUARDED_BY(_mutex);
  std::size_t _calls VESK_GUARDED_BY(_mutex) = 0;   ///< queued, or taken and not left yet
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;  ///< theirs
  bool _hasAnsweredCall VESK_GUARDED_BY(_mutex) = false;
  WakeFor _wakeFor VESK_GUARDED_BY(_mutex) = WakeFor::NothingQueued;
  bool _isClosed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
