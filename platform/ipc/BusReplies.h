// The answers that one bus owes its peer. Private to platform/ipc.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <unordered_map>
#include <vector>

#include "platform/ipc/BusHandles.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Sends answers at once on the bus's own thread; an answer given on another thread waits for that thread.
/// Shared by the connection and by every reply closure, which may outlive the bus: then an answer goes
/// nowhere.
class BusReplies {
 public:
  using Ticket = std::uint64_t;

  /// Calls of one peer that may wait for their answers. Calls are served one after another, so only a handler
  /// that puts its answers off comes near this.
  static constexpr std::size_t kMaximumOwed = 256;

  /// `wake` makes the bus's thread call `sendWaiting`; any thread calls it.
  explicit BusReplies(std::function<void()> wake) : _wake(std::move(wake)) {}

  // On the bus's thread.

  void open(sd_bus* bus);
  /// Nothing when too many answers are owed.
  std::optional<Ticket> keep(sd_bus_message* call);
  void send(sd_bus_message* call, const std::vector<IPCArgument>& arguments) noexcept;
  void sendError(sd_bus_message* call, const char* errorName, const char* text) noexcept;
  /// Sends what other threads have answered.
  void sendWaiting();
  /// Forgets what is owed; the bus may go away.
  void close();

  // On any thread.

  void answer(Ticket ticket, std::vector<IPCArgument> arguments) noexcept;
  void refuse(Ticket ticket, const char* errorName, const char* text) noexcept;

 private:
  struct Answer {
    Ticket ticket;
    std::vector<IPCArgument> arguments;
    const char* errorName = nullptr;  // a constant
    const char* errorText = nullptr;  // a constant
  };

  void settle(Answer answer) noexcept;
  void sendNow(const Answer& answer) noexcept;

  const std::function<void()> _wake;

  // Touched by the bus's thread only.
  std::thread::id _thread;
  sd_bus* _bus = nullptr;
  Ticket _lastTicket = 0;
  std::unordered_map<Ticket, BusMessageHandle> _owed;

  Mutex _mutex;
  bool _closed VESK_GUARDED_BY(_mutex) = false;
  std::vector<Answer> _waiting VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
