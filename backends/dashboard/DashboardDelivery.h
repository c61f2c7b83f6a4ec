// How a dashboard's datagrams get to the server: queue, retransmissions, acknowledgements, orderly shutdown.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/dashboard/DashboardDatagram.h"
#include "backends/dashboard/DashboardLinger.h"
#include "backends/dashboard/UDPPacketToSend.h"
#include "platform/net/UDPSocket.h"
#include "platform/queue/Metronome.h"
#include "platform/queue/TimedQueue.h"
#include "platform/sync/Mutex.h"
#include "util/Counters.h"

namespace vesk {

/// The network half of a dashboard backend. Everything that touches the socket, the queue of datagrams or the
/// state of the shutdown runs on one serial queue.
///
/// Life: the backend holds it, and so do the work on the queue and, while datagrams are pending, the timer;
/// the read source and the last resort do not. So it outlives its backend until the last datagram has gone
/// or 9.5 s are over, and then lets go of everything. When the queue's threads are stopped before, it goes
/// with its handlers. The socket is closed by the teardown, or with the object. Only so many may outlive
/// their backends at a time; from `cleanup` to its teardown each takes a place.
class DashboardDelivery : public std::enable_shared_from_this<DashboardDelivery> {
 public:
  using Buffer = std::array<char, kDashboardBufferSize>;

  static constexpr std::chrono::milliseconds kDefaultTick{500};
  static constexpr std::chrono::milliseconds kLastResort{9'500};
  static constexpr std::size_t kMaximumQueued = 50;
  static constexpr std::size_t kMaximumHandedOver = 1024;
  /// What the system has no room for is tried again after this.
  static constexpr std::chrono::milliseconds kRoomWait{10};

  /// `socket` is open. Drops are counted in `counters` under `backendName`.
  DashboardDelivery(UDPSocket socket, std::shared_ptr<TimedQueue> networkProcQueue,
                    std::shared_ptr<DashboardLinger> linger, Counters& counters, std::string backendName);
  ~DashboardDelivery();
  DashboardDelivery(const DashboardDelivery&) = delete;
  DashboardDelivery& operator=(const DashboardDelivery&) = delete;

  // --- Construction: in this order, on one thread. After a failure, `cleanup` gives everything back.

  /// Switches reliable delivery on if the socket can be bound.
  void useReliableUDP();
  /// False when the system refuses.
  [[nodiscard]] bool connect(const IPv4Endpoint& server);
  /// Starts the periodic task. False when there is no timer to be had.
  [[nodiscard]] bool start(std::chrono::milliseconds tick);

  // --- From any thread

  /// Constant once constructed.
  bool isReliable() const noexcept { return _reliableUDP; }
  /// Sends the first `length` bytes. Never waits for the network; what is sent faster than the system takes
  /// it is bounded, the excess dropped and counted, as is what there is no memory for.
  void send(std::unique_ptr<Buffer> buffer, std::uint16_t length, std::uint16_t eventNumber);
  /// Asks for the shutdown: at once when nothing is pending, else when nothing is any more, 9.5 s after the
  /// next tick at the latest. When no place is left, tears down at once what then counts as unacknowledged,
  /// and waits for that. Safe to call twice; not from the queue.
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
  /// False, and nothing has happened, when the system has no room for it.
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
  void countLost(DropReason reason, std::size_t count = 1);

  // Constant after construction.
  const std::shared_ptr<TimedQueue> _networkProcQueue;
  const std::shared_ptr<DashboardLinger> _linger;
  Counters& _counters;
  const std::string _backendName;
  bool _reliableUDP = false;

  // On the queue only, once constructed.
  UDPSocket _socket;
  IPv4Endpoint _server;
  bool _hasReconnected = false;  ///< since the last tick
  std::vector<UDPPacketToSend> _messageQueue;
  std::unique_ptr<TimedQueue::Source> _readSource;
  std::optional<Metronome> _timer;
  CleanupState _cleanupState = Running;
  bool _waitsForRoom = false;  ///< what is handed over, and work on the queue comes back to it

  // Guarded by _mutex, a leaf.
  Mutex _mutex;
  std::vector<HandedOver> _handedOver VESK_GUARDED_BY(_mutex);
  bool _hasPlace VESK_GUARDED_BY(_mutex) = false;
  bool _isTornDown VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
