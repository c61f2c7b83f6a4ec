#include "backends/dashboard/DashboardDelivery.h"

#include <algorithm>
#include <cerrno>
#include <exception>
#include <future>
#include <iterator>
#include <system_error>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

/// The ticks before each retransmission. The array's size is the maximum number of retransmissions.
constexpr std::array<std::int32_t, 4> kTicksBeforeRetransmit{2, 3, 5, 9};

}  // namespace

DashboardDelivery::DashboardDelivery(UDPSocket socket, std::shared_ptr<TimedQueue> networkProcQueue,
                                     std::shared_ptr<DashboardLinger> linger,
                                     std::shared_ptr<const Outcomes> outcomes)
    : _networkProcQueue(std::move(networkProcQueue)),
      _linger(std::move(linger)),
      _outcomes(std::move(outcomes)),
      _socket(std::move(socket)) {}

DashboardDelivery::~DashboardDelivery() {
  MutexLock lock(_mutex);
  countLost(DropReason::Unacknowledged, _messageQueue.size() + _handedOver.size());
  leavePlace();
}

// --- Construction

void DashboardDelivery::useReliableUDP() {
  if (const auto bound = _socket.bindToAnyPort(); !bound) {
    VESK_LOG_ERROR("DashboardBackend(useReliableUDP): can't bind socket, %d", bound.error().number);
    return;
  }
  _reliableUDP = true;
}

bool DashboardDelivery::connect(const IPv4Endpoint& server) {
  _server = server;
  if (!_socket.connect(server)) return false;
  if (_reliableUDP) watchForAnswers();
  return true;
}

// Only call this once connected: an unconnected socket would read anyone's datagrams.
void DashboardDelivery::watchForAnswers() {
  try {
    _readSource = _networkProcQueue->makeReadSource(_socket.sharedDescriptor(), [weak = weak_from_this()] {
      if (auto self = weak.lock()) self->processSocketRead();
    });
  } catch (const std::exception&) {
    VESK_LOG_ERROR("DashboardBackend(useReliableUDP): can't create read source");
  }
}

bool DashboardDelivery::start(std::chrono::milliseconds tick) {
  try {
    _timer.emplace(*_networkProcQueue, tick);
    _networkProcQueue->submit([self = shared_from_this()] {
      if (self->_timer) self->_timer->start([self] { self->myPeriodicTask(); });
    });
    return true;
  } catch (const std::exception&) {
    return false;
  }
}

// --- From the session

void DashboardDelivery::send(std::unique_ptr<Buffer> buffer, std::uint16_t length,
                             std::uint16_t eventNumber) {
  bool isFirst = false;
  try {
    {
      MutexLock lock(_mutex);
      if (_handedOver.size() >= kMaximumHandedOver) return lose(eventNumber, DropReason::OverBound);
      isFirst = _handedOver.empty();
      _handedOver.push_back({std::move(buffer), length, eventNumber});
    }
    // The task that is already queued takes this datagram along.
    if (isFirst) _networkProcQueue->submit([self = shared_from_this()] { self->sendHandedOver(); });
  } catch (const std::exception&) {  // out of memory
    MutexLock lock(_mutex);
    if (!isFirst) return lose(eventNumber, DropReason::OverBound);
    // No task will handle the list. If it stayed, later datagrams would wait for such a task for ever.
    countLost(DropReason::OverBound, std::max<std::size_t>(_handedOver.size(), 1));
    _handedOver.clear();
  }
}

void DashboardDelivery::cleanup() {
  bool mayLinger = false;
  {
    MutexLock lock(_mutex);
    if (_isTornDown) return;
    _hasPlace = mayLinger = _hasPlace || _linger->try_acquire();
  }
  if (mayLinger) {
    _networkProcQueue->submit([self = shared_from_this()] {
      if (!self->isPending()) return self->cleanupSources();
      if (self->_cleanupState == Running) self->_cleanupState = Requested;
      self->keepTicking();
    });
    return;
  }
  // Waits, so that a client that creates deliveries faster than the queue ends them can't accumulate sockets.
  std::promise<void> ended;
  auto end = ended.get_future();  // also ready if the queue is stopped and drops the work
  _networkProcQueue->submit(
      [self = shared_from_this(), ended = std::make_shared<std::promise<void>>(std::move(ended))] {
        self->cleanupSources();
        ended->set_value();
      });
  end.wait();
}

// --- On the queue

void DashboardDelivery::sendHandedOver() {
  if (_waitsForRoom) return;
  std::vector<HandedOver> datagrams;
  {
    MutexLock lock(_mutex);
    datagrams.swap(_handedOver);
  }
  const auto rest = std::find_if_not(datagrams.begin(), datagrams.end(), [this](const auto& datagram) {
    return tryToSendMsg(datagram.buffer->data(), datagram.length, datagram.eventNumber);
  });
  datagrams.erase(datagrams.begin(), rest);
  if (!datagrams.empty()) waitForRoom(std::move(datagrams));
}

/// Puts the datagrams back, before those handed over meanwhile.
void DashboardDelivery::waitForRoom(std::vector<HandedOver> datagrams) {
  try {
    _networkProcQueue->submitAfter(kRoomWait, [self = shared_from_this()] {
      self->_waitsForRoom = false;
      self->sendHandedOver();
    });
    _waitsForRoom = true;
    MutexLock lock(_mutex);
    const std::size_t kept = std::min(_handedOver.size(), kMaximumHandedOver - datagrams.size());
    const auto excess = _handedOver.begin() + static_cast<std::ptrdiff_t>(kept);
    countLost(DropReason::OverBound, _handedOver.size() - kept);
    _handedOver.erase(excess, _handedOver.end());
    datagrams.insert(datagrams.end(), std::make_move_iterator(_handedOver.begin()),
                     std::make_move_iterator(_handedOver.end()));
    _handedOver = std::move(datagrams);
  } catch (const std::exception&) {  // out of memory
    countLost(DropReason::OverBound, datagrams.size());
  }
}

bool DashboardDelivery::tryToSendMsg(const char* bytes, std::uint16_t length, std::uint16_t eventNumber) {
  if (!_timer) {  // torn down: there will be no further attempt
    lose(eventNumber, DropReason::Unacknowledged);
    return true;
  }
  const std::string_view datagram(bytes, length);
  const auto outcome = transmit(datagram);
  if (outcome == UDPSocket::Outcome::WouldBlock) return false;
  const bool isSent = outcome == UDPSocket::Outcome::Sent;
  if (isSent && !_reliableUDP) {
    show("sent", eventNumber);
    return true;
  }
  UDPPacketToSend packet(datagram, eventNumber);
  if (isSent) packet.setState(UDPPacketToSend::Sent);
  append(std::move(packet));
  return true;
}

/// The connection keeps the device's address from when it was made. When that address is gone, reconnects to
/// find another, at most once per tick.
UDPSocket::Outcome DashboardDelivery::transmit(std::string_view datagram) {
  const auto outcome = _socket.send(datagram);
  if (outcome != UDPSocket::Outcome::NoRoute || std::exchange(_hasReconnected, true)) return outcome;
  return _socket.reconnect(_server) ? _socket.send(datagram) : outcome;
}

void DashboardDelivery::append(UDPPacketToSend packet) {
  _messageQueue.push_back(std::move(packet));
  if (_messageQueue.size() > kMaximumQueued) {
    lose(_messageQueue.front().eventNumber(), DropReason::OverBound);
    _messageQueue.erase(_messageQueue.begin());
  }
  keepTicking();
}

void DashboardDelivery::processSocketRead() {
  Buffer buffer;
  const auto size = _socket.receive(buffer);
  if (!size) return;
  const auto eventID = eventIDOfAcknowledgement({buffer.data(), *size});
  if (!eventID) return;
  for (auto packet = _messageQueue.begin(); packet != _messageQueue.end(); ++packet) {
    if (packet->eventNumber() != *eventID) continue;
    show("delivered", *eventID);
    _messageQueue.erase(packet);
    return;
  }
}

void DashboardDelivery::myPeriodicTask() {
  _hasReconnected = false;
  walkQueue();
  if (_cleanupState != Running) {
    continueShutdown();
  } else if (_messageQueue.empty() && _timer) {
    _timer->pause();  // until there are datagrams to watch again
  }
}

void DashboardDelivery::walkQueue() {
  for (std::size_t index = 0; index < _messageQueue.size();) {
    UDPPacketToSend& packet = _messageQueue[index];
    bool isDone = false;
    if (packet.state() == UDPPacketToSend::Unsent) {
      const bool isSent = transmit(packet.data()) == UDPSocket::Outcome::Sent;
      if (isSent && _reliableUDP) packet.setState(UDPPacketToSend::Sent);
      isDone = isSent && !_reliableUDP;
      if (isDone) show("sent", packet.eventNumber());
    } else {
      isDone = !keepsWaiting(packet);
    }
    if (isDone) {
      _messageQueue.erase(_messageQueue.begin() + static_cast<std::ptrdiff_t>(index));
    } else {
      ++index;
    }
  }
}

/// One tick of a datagram that waits for its acknowledgement. Returns false once it is abandoned.
bool DashboardDelivery::keepsWaiting(UDPPacketToSend& packet) {
  const auto retransmits = static_cast<std::size_t>(packet.numberOfRetransmits());
  if (retransmits >= kTicksBeforeRetransmit.size()) {
    lose(packet.eventNumber(), DropReason::Unacknowledged);
    return false;
  }
  const std::int32_t checks = packet.numberOfChecks() + 1;
  if (checks < kTicksBeforeRetransmit[retransmits]) {
    packet.setNumberOfChecks(checks);
  } else if (transmit(packet.data()) == UDPSocket::Outcome::Sent) {
    packet.setNumberOfChecks(0);
    packet.setNumberOfRetransmits(packet.numberOfRetransmits() + 1);
  }
  return true;
}

void DashboardDelivery::continueShutdown() {
  if (!isPending()) {
    VESK_LOG_DEBUG("DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
    cleanupSources();
  } else if (_cleanupState == Requested) {
    _cleanupState = LastResortScheduled;
    VESK_LOG_DEBUG("DashboardBackend(myPeriodicTask): scheduled last resort clean-up in %d ms.",
                   static_cast<int>(kLastResort.count()));
    // The timer normally keeps this object alive. Once it doesn't, there is nothing left to do.
    _networkProcQueue->submitAfter(kLastResort, [weak = weak_from_this()] {
      if (auto self = weak.lock()) self->cleanupSources();
    });
  }
}

void DashboardDelivery::keepTicking() {
  if (_timer && _timer->isPaused()) _timer->resume([self = shared_from_this()] { self->myPeriodicTask(); });
}

// The caller must hold a reference, since the sources may have held the last others.
void DashboardDelivery::cleanupSources() {
  _timer.reset();
  _readSource.reset();
  _socket.close();
  MutexLock lock(_mutex);
  _isTornDown = true;
  leavePlace();
}

void DashboardDelivery::leavePlace() {
  if (std::exchange(_hasPlace, false)) _linger->release();
}

void DashboardDelivery::countLost(DropReason reason, std::size_t count) const {
  if (count > 0) _outcomes->count("datagram", reason, count);
}

void DashboardDelivery::lose(std::uint16_t eventNumber, DropReason reason) const {
  _outcomes->count("datagram", reason, 1, [eventNumber] { return Dictionary{{"eventID", eventNumber}}; });
}

void DashboardDelivery::show(const char* outcome, std::uint16_t eventNumber) const {
  if (_outcomes->isWatched()) _outcomes->show("datagram", outcome, {{"eventID", eventNumber}});
}

}  // namespace vesk
