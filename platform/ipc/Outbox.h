// What one connection is to send. Private to platform/ipc.
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

/// Answers to the peer's calls, written by whoever gives them, and calls to the peer wait here until the
/// connection's thread takes them. Shared by the connection and every reply closure, which may outlive it:
/// then an answer goes nowhere. Bounded, because a peer that does not read must cost its session only so
/// much. Thread-safe; its lock is a leaf.
class Outbox {
 public:
  /// Calls of one peer that may be owed an answer. Calls are served one after another, so only a handler that
  /// puts its answers off comes near this.
  static constexpr std::size_t kMaximumOwed = 256;
  /// Bytes that all waiting calls hold together, unless there is only one.
  static constexpr std::size_t kMaximumMemory = std::size_t{4} << 20;

  /// `wake` makes the connection's thread take what waits; any other thread calls it.
  explicit Outbox(std::size_t maximumCalls = 0, std::function<void()> wake = nullptr)
      : _maximumCalls(maximumCalls), _wake(std::move(wake)) {}
  /// Told by the connection's thread which it is: for its own answers it need not be woken.
  void setThread(std::thread::id thread) noexcept { _thread.store(thread); }

  /// Answers the call with that number, while it is served. An answer that can't be written becomes an error.
  void send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void sendError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// Notes that a call is answered later, by one of the next two. False when too many are.
  [[nodiscard]] bool owe();
  void settle(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void settleWithError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// Null when the call, a whole message, was taken, else why it was not.
  const char* put(std::string call);

  // On the connection's thread.

  /// Puts the answers that wait into the channel's output.
  void moveAnswersTo(Channel& channel);
  /// The next call; empty when there is none.
  std::string takeCall();
  bool hasCalls() const;
  /// Whether an answer could not even be written as an error. Its caller would wait for ever, so the
  /// connection has to end.
  bool isBroken() const noexcept { return _isBroken.load(); }
  /// Forgets what waits and what will come; returns how many calls are lost, in all.
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
  std::size_t _memory VESK_GUARDED_BY(_mutex) = 0;  // of the calls
};

}  // namespace vesk
