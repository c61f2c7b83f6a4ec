// The thread of one session.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <random>
#include <string_view>
#include <vector>

#include "client/AggregationReceiver.h"
#include "client/CallQueue.h"
#include "client/ClientCall.h"
#include "client/DaemonLink.h"
#include "client/StartPolicy.h"
#include "protocol/WireNames.h"

namespace vesk {

/// Takes calls from the queue, maintains the connection to the daemon, sends, and receives answers and
/// aggregated messages. Unless marked otherwise, members are used only by the thread that runs `run`.
class SessionWorker {
 public:
  explicit SessionWorker(const ReportingOptions& options)
      : _queue(options), _link(options, _receiver), _starts(options.refreshInterval) {}

  // Thread-safe.

  /// After it is closed, `run` returns once everything is sent, answered and accepted by the daemon, or at
  /// the queue's drain deadline.
  CallQueue& queue() noexcept { return _queue; }
  bool isConnected() const noexcept { return _isConnected.load(std::memory_order_relaxed); }

  /// The thread's body.
  void run() noexcept;

 private:
  using Clock = std::chrono::steady_clock;
  using Time = Clock::time_point;
  using Call = ClientCalls::iterator;

  enum class Farewell { NotYet, Asked, Answered };

  void step();
  bool isFinished(Time now) const noexcept;
  void endEverything() noexcept;

  DaemonLink::Urgency takeCalls() noexcept;
  void endOverdue(Time now) noexcept;
  void endRequests(ReportingStatus status, std::string_view detail) noexcept;
  void finish(ClientCall& call, ReportingStatus status, BusAnswer* answer = nullptr,
              std::string_view detail = {}) noexcept;
  void drop(Call call, Drop reason) noexcept;
  void leave(Call call) noexcept;

  bool wantsDaemon() const noexcept;
  void reachDaemon(Time now, DaemonLink::Urgency urgency);
  void linkHasChanged(DaemonLink::Change change);
  void introduceAgain();
  bool start();
  bool startIsDue(Time now) const noexcept;
  void startWasAnswered(const BusAnswer& answer);
  bool mayGetConfiguration() const noexcept;
  bool tell(const wire::Member& member, const std::vector<IPCArgument>& arguments);
  void remember(ClientCall& call) noexcept;

  bool canSend();
  void sendWaiting(Time now);
  bool sendTogether(Time now);
  ReportingStatus handOver(Call call, Time now);
  void callsHaveLeft();
  void answered(Call call, BusAnswer& answer) noexcept;
  void connectionBroke(Time now);
  void sayFarewell(Time now);

  void sleep(Time now);
  Time nextDue(Time now);
  CallQueue::WakeFor wakeFor() const noexcept;

  // Thread-safe by themselves.
  CallQueue _queue;
  std::atomic<bool> _isConnected{false};

  // Used only by the thread. Each call is in one of these three lists.
  ClientCalls _waiting;   ///< to be sent; the first `_callsInBus` are one-way and already in the bus
  ClientCalls _owed;      ///< sent, not yet answered
  ClientCalls _requests;  ///< requests for a connection
  /// One-way calls that the bus has but the socket has not fully taken: resent if the connection is lost.
  std::size_t _callsInBus = 0;
  /// At or before the deadlines of all calls that wait or request a connection.
  Time _firstDeadline = Time::max();

  const std::shared_ptr<AggregationReceiver> _receiver = std::make_shared<AggregationReceiver>();
  DaemonLink _link;
  // As last sent; resent to the daemon after a reconnection.
  std::optional<std::vector<IPCArgument>> _configuration;
  bool _isStarted = false;
  StartPolicy _starts;
  std::minstd_rand _random{std::random_device{}()};

  std::optional<Time> _drainDeadline;  ///< set once the session is being closed
  Farewell _farewell = Farewell::NotYet;
  bool _isHopeless = false;  ///< closing, and the daemon was never reached
  bool _isNapping = false;
};

}  // namespace vesk
