// The delivery of a dashboard's datagrams: queue, retransmissions, acknowledgements and shutdown.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/Outcomes.h"
#include "backends/dashboard/DashboardDatagram.h"
#include "backends/dashboard/DashboardLinger.h"
#include "backends/dashboard/UDPPacketToSend.h"
#include "platform/net/UDPSocket.h"
#include "platform/queue/Metronome.h"
#include "platform/queue/TimedQueue.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// The network half of a dashboard backend. A serial queue runs everything that uses the socket, the queued
/// datagrams or the shutdown's state.
///
/// Owned by the backend, by the work on the queue and, while datagrams are pending, by the timer, but not by
/// the read source and the last-resort task. It therefore outlives its backend until the last datagram is
/// done or 9.5 s have passed. If the queue's threads are stopped before that, it is destroyed with its
/// handlers. The socket is closed by the teardown or the destructor. The number of deliveries that outlive
/// their backends is limited: each takes a slot from `cleanup` to its teardown.
class DashboardDelivery : public std::enable_shared_from_this<DashboardDelivery> {
 public:
  /// From malloc, and null if that fails: a lack of memory then costs one message, not the daemon.
  struct Buffer : std::array<char, kDashboardBufferSize> {
    static void* operator new(std::size_t size) noexcept { return std::malloc(size); }
    static void operator delete(void* buffer) noexcept { std::free(buffer); }
  };

  static constexpr std::chrono::milliseconds kDefaultTick{500};
  static constexpr std::chrono::milliseconds kLastResort{9'500};
  static constexpr std::size_t kMaximumQueued = 50;
  static constexpr std::size_t kMaximumHandedOver = 1024;
  /// The delay before a datagram is sent again if the system had no room for it.
  static constexpr std::chrono::milliseconds kRoomWait{10};

  /// `socket` must be open.
  DashboardDelivery(UDPSocket socket, std::shared_ptr<TimedQueue> networkProcQueue,
                    std::shared_ptr<DashboardLinger> linger, std::shared_ptr<const Outcomes> outcomes);
  ~DashboardDelivery();
  DashboardDelivery(const DashboardDelivery&) = delete;
  DashboardDelivery& operator=(const DashboardDelivery&) = delete;

  // --- Construction: in this order, on one thread. After a failure, call `cleanup`.

  /// Enables reliable delivery if the socket can be bound.
  void useReliableUDP();
  /// Returns false if the system refuses.
  [[nodiscard]] bool connect(const IPv4Endpoint& server);
  /// Starts the periodic task. Returns false if no timer is available.
  [[nodiscard]] bool start(std::chrono::milliseconds tick);

  // --- From any thread

  /// Constant once constructed.
  bool isReliable() const noexcept { return _reliableUDP; }
  /// Sends the first `length` bytes. Never waits for the network. Datagrams that the system can't take yet
  /// are queued up to a limit; beyond it they are dropped and counted.
  void send(std::unique_ptr<Buffer> buffer, std::uint16_t length, std::uint16_t eventNumber);
  /// Requests the shutdown. It happens once nothing is pending, at the latest 9.5 s after the next tick. If
  /// no slot is free, it happens at once, counts pending datagrams as unacknowledged, and this call waits for
  /// it. Safe to call twice. Must not be called from the queue.
  void cleanup();

 private:
  struct HandedOver {
    std::unique_ptr<Buffer> buffer;
    std::uint16_t length;
    std::uint16_t eventNumber;
  };
  enum CleanupState : std::int32_t { Running = 0, Requested = 1, LastResortScheduled = 2 };

  void watchForAnswers();

  // On the queue.
  void sendHandedOver();
  void waitForRoom(std::vector<HandedOver> datagrams);
  /// Returns false, without any effect, if the system has no room for the datagram.
  [[nodiscard]] bool tryToSendMsg(const char* bytes, std::uint16_t length, std::uint16_t eventNumber);
  void append(UDPPacketToSend packet);
  UDPSocket::Outcome transmit(std::string_view datagram);
  bool isPending() const noexcept { return _waitsForRoom || !_messageQueue.empty(); }
  void processSocketRead();
  void myPeriodicTask();
  void walkQueue();
  bool keepsWaiting(UDPPacketToSend& packet);
  void continueShutdown();
  void keepTicking();
  void cleanupSources();
  void leavePlace() VESK_REQUIRES(_mutex);
  void show(const char* outcome, std::uint16_t eventNumber) const;
  void countLost(DropReason reason, std::size_t count = 1) const;
  void lose(std::uint16_t eventNumber, DropReason reason) const;

  // Constant after construction.
  const std::shared_ptr<TimedQueue> _networkProcQueue;
  const std::shared_ptr<DashboardLinger> _linger;
  const std::shared_ptr<const Outcomes> _outcomes;
  bool _reliableUDP = false;

  // Only used on the queue, once constructed.
  UDPSocket _socket;
  IPv4Endpoint _server;
  bool _hasReconnected = false;  ///< since the last tick
  std::vector<UDPPacketToSend> _messageQueue;
  std::unique_ptr<TimedQueue::Source> _readSource;
  std::optional<Metronome> _timer;
  CleanupState _cleanupState = Running;
  bool _waitsForRoom = false;  ///< datagrams are in `_handedOver`, and a queued task will send them

  // Guarded by _mutex, a leaf.
  Mutex _mutex;
  std::vector<HandedOver> _handedOver VESK_GUARDED_BY(_mutex);
  bool _hasPlace VESK_GUARDED_BY(_mutex) = false;
  bool _isTornDown VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
