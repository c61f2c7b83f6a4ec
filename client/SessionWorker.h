// The thread of one session.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <string_view>
#include <vector>

#include "client/CallQueue.h"
#include "client/ClientCall.h"
#include "client/DaemonLink.h"
#include "client/DropCounters.h"
#include "client/SessionMemory.h"
#include "client/WaitingCalls.h"
#include "client/protocol/ClientSessionInterface.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Takes calls out of the queue, keeps the link to the daemon, sends, and receives answers and aggregated
/// messages. What is not said to be for any thread belongs to the thread that runs `run`.
class SessionWorker final : private ClientSessionReplyInterface {
 public:
  explicit SessionWorker(const ReportingOptions& options);

  // For any thread.

  CallQueue& queue() noexcept { return _queue; }
  DropCounters& drops() noexcept { return _drops; }
  bool isConnected() const noexcept { return _isConnected.load(std::memory_order_relaxed); }
  /// Has the daemon reached now; `end` learns the outcome. False, and `end` learns nothing, when the thread
  /// has ended. Throws std::bad_alloc.
  [[nodiscard]] bool requestConnection(std::shared_ptr<CallEnd> end, ClientCall::Time deadline);
  /// Lets `run` return once everything is sent, answered and taken by the daemon, at the latest at
  /// `deadline`. No further call gets into the queue.
  void stop(ClientCall::Time deadline) noexcept;

  /// The thread's body.
  void run() noexcept;

 private:
  using Clock = std::chrono::steady_clock;
  using Time = Clock::time_point;

  struct ConnectionRequest {
    std::shared_ptr<CallEnd> end;
    Time deadline;
  };
  enum class Farewell { NotYet, Asked, Answered };

  void step();
  bool isFinished(Time now) const noexcept;
  void endEverything() noexcept;

  void takeCalls();
  void takeRequests();
  void tellOfDrops() noexcept;
  void endOverdue(Time now);
  void endRequests(ReportingStatus status, std::string_view detail);

  bool wantsDaemon() const noexcept;
  void reachDaemon(Time now);
  void linkHasChanged(DaemonLink::Change change);
  void introduceAgain();

  bool canSend();
  void sendWaiting(Time now);
  void sendTogether(Time now);
  void sendFront(Time now);
  void handedOver(const ClientCall& call) noexcept;
  void connectionBroke(Time now);
  void callsHaveLeft();
  void frontWasSent() noexcept;
  void frontHasLeft() noexcept;
  void giveRoomBack() noexcept;
  void sayFarewell(Time now);
  void finish(const std::shared_ptr<CallEnd>& end, ReportingStatus status, BusAnswer* answer,
              std::string_view detail) noexcept;
  void finishWithAnswer(const std::shared_ptr<CallEnd>& end, Time deadline, BusAnswer& answer) noexcept;

  void sleep(Time now);
  Time nextDue(Time now);
  CallQueue::WakeFor wakeFor() const noexcept;

  void sendMessageToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type,
                           const std::optional<Dictionary>& payload) override;

  // Safe from any thread by themselves.
  CallQueue _queue;
  DropCounters _drops;
  std::atomic<bool> _isConnected{false};

  Mutex _mutex;
  std::vector<ConnectionRequest> _newRequests VESK_GUARDED_BY(_mutex);
  std::optional<Time> _newDrainDeadline VESK_GUARDED_BY(_mutex);
  bool _hasEnded VESK_GUARDED_BY(_mutex) = false;

  // The thread's own.
  DaemonLink _link;
  SessionMemory _memory;
  WaitingCalls _waiting;
  std::vector<ClientCall> _taken;
  std::vector<ConnectionRequest> _requests;
  DaemonLink::Urgency _urgency = DaemonLink::Urgency::WhenDue;
  std::optional<Time> _drainDeadline;  ///< set once the session is being closed
  std::size_t _answersOwed = 0;
  std::size_t _callsGone = 0;  ///< whose room in the queue is not given back yet
  std::size_t _memoryGone = 0;
  /// The first of those that wait: sent, but the socket has not taken all of them yet.
  std::size_t _callsInBus = 0;
  bool _isNapping = false;
  bool _isHopeless = false;  ///< closing, and there never was a daemon
  bool _isClosed = false;
  Farewell _farewell = Farewell::NotYet;
};

}  // namespace vesk
