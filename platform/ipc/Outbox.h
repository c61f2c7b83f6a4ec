// Messages waiting to be sent on one connection. Private to platform/ipc.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <exception>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/ipc/Channel.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Holds answers to the peer's calls, added by any thread, and calls to the peer until the connection's
/// thread takes them. Shared by the connection and every reply closure, which may outlive it; its answer is
/// then discarded. Bounded, to limit what a peer that doesn't read can cost its session. Thread-safe; its
/// lock is a leaf.
class Outbox {
 public:
  /// Limit on a peer's calls with deferred answers. Calls are served one after another, so only a handler
  /// that defers its answers comes near this.
  static constexpr std::size_t kMaximumOwed = 256;
  /// Limit on the bytes of all waiting calls together; a single call may exceed it.
  static constexpr std::size_t kMaximumMemory = std::size_t{4} << 20;

  /// `wake` makes the connection's thread take waiting messages; called only by other threads.
  explicit Outbox(std::size_t maximumCalls = 0, std::function<void()> wake = nullptr)
      : _maximumCalls(maximumCalls), _wake(std::move(wake)) {}
  /// Called by the connection's thread, which need not be woken for its own answers.
  void setThread(std::thread::id thread) noexcept { _thread.store(thread); }

  /// Answers the call with that serial number while it is being served. An answer that can't be written
  /// becomes an error.
  void send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void sendError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// Registers a call that one of the next two functions answers later. Returns false if there are too many.
  [[nodiscard]] bool owe();
  void settle(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void settleWithError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// Takes a call, a whole message. Returns null on success, otherwise the reason.
  const char* put(std::string call);

  // Only for the connection's thread.

  /// Moves waiting answers into the channel's output.
  void moveAnswersTo(Channel& channel);
  /// Returns the next call; empty if there is none.
  std::string takeCall();
  bool hasCalls() const;
  /// Whether an answer could not even be written as an error. Its caller would wait for ever, so the
  /// connection must end.
  bool isBroken() const noexcept { return _isBroken.load(); }
  /// Discards everything that waits or is added later. Returns the total number of calls lost.
  std::size_t close();

 private:
  CodecResult write(const OutgoingHeader& header, const std::vector<IPCArgument>& arguments);
  void lose(const std::exception& error) noexcept;
  void paid() noexcept;
  void wake() const noexcept;

  const std::size_t _maximumCalls;
  const std::function<void()> _wake;
  std::atomic<std::uint32_t> _lastSerial{0};
  std::atomic<bool> _isBroken{false};
  std::atomic<std::thread::id> _thread{};

  mutable Mutex _mutex;
  bool _closed VESK_GUARDED_BY(_mutex) = false;
  std::size_t _owed VESK_GUARDED_BY(_mutex) = 0;
  std::vector<std::string> _answers VESK_GUARDED_BY(_mutex);
  std::deque<std::string> _calls VESK_GUARDED_BY(_mutex);
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;  // of the waiting calls
};

}  // namespace vesk
