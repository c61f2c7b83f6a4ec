// The answers that one connection owes its peer. Private to platform/ipc.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
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

/// Whoever answers a call writes the message, which waits here until the connection's thread takes it. Shared
/// by the connection and every reply closure, which may outlive it: then an answer goes nowhere. Thread-safe;
/// its lock is a leaf.
class Answers {
 public:
  /// Calls of one peer that may be owed an answer. Calls are served one after another, so only a handler that
  /// puts its answers off comes near this.
  static constexpr std::size_t kMaximumOwed = 256;

  /// `wake` makes the connection's thread call `moveTo`; any other thread calls it.
  explicit Answers(std::function<void()> wake) : _wake(std::move(wake)) {}
  /// Told by the connection's thread which it is: for its own answers it need not be woken.
  void setThread(std::thread::id thread) noexcept { _thread.store(thread); }

  /// Answers the call with that number, while it is served. An answer that can't be written becomes an error.
  void send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void sendError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// Notes that a call is answered later, by one of the next two. False when too many are.
  [[nodiscard]] bool owe();
  void settle(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept;
  void settleWithError(std::uint32_t call, const char* errorName, const char* text) noexcept;

  /// On the connection's thread: puts what waits into the channel's output.
  void moveTo(Channel& channel);
  /// Whether an answer could not even be written as an error. Its caller would wait for ever, so the
  /// connection has to end.
  bool isBroken() const noexcept { return _isBroken.load(); }
  /// Drops what waits and what will come.
  void close() noexcept;

 private:
  CodecResult write(const OutgoingHeader& header, const std::vector<IPCArgument>& arguments);
  void lose(const std::exception& error) noexcept;
  void paid() noexcept;

  const std::function<void()> _wake;
  std::atomic<std::uint32_t> _lastSerial{0};
  std::atomic<bool> _isBroken{false};
  std::atomic<std::thread::id> _thread{};

  Mutex _mutex;
  bool _closed VESK_GUARDED_BY(_mutex) = false;
  std::size_t _owed VESK_GUARDED_BY(_mutex) = 0;
  std::vector<std::string> _waiting VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
