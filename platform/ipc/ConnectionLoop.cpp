#include "platform/ipc/ConnectionLoop.h"

#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>

#include "platform/ipc/BusCodec.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// Of answers and calls, inside the relay; the client's socket holds as much again.
constexpr int kUnreadBytes = 128 * 1024;

/// Milliseconds for poll() until `deadline`, rounded up so that it has passed when poll() returns.
int untilDeadline(std::chrono::steady_clock::time_point deadline) {
  auto left =
      std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::clamp<long long>(left, 0, 1'000'000));
}

int countMessage(sd_bus_message*, void* count, sd_bus_error*) {
  ++*static_cast<std::uint64_t*>(count);
  return 0;  // others look at it too
}

/// A server's bus on the inner end of a relay.
BusHandle openBus(FileDescriptor socket) {
  const int inner = socket.get();
  BusHandle bus = newBus(std::move(socket));
  sd_id128_t identity{};
  checkBus(sd_id128_randomize(&identity), "sd_id128_randomize");
  checkBus(sd_bus_set_server(bus.get(), 1, identity), "sd_bus_set_server");
  checkBus(sd_bus_start(bus.get()), "sd_bus_start");
  // sd-bus has asked for 8 MiB, which a client that reads nothing would fill.
  ::setsockopt(inner, SOL_SOCKET, SO_SNDBUF, &kUnreadBytes, sizeof kUnreadBytes);
  return bus;
}

}  // namespace

ConnectionLoop::ConnectionLoop(int socket, const IPCPeer& peer, const std::string& name,
                               const ConnectionSettings& settings, Outbox& outbox, const Wakeup& wakeup,
                               BusReplies& replies, CallRouter& router)
    : _socket(socket),
      _name(name),
      _settings(settings),
      _outbox(outbox),
      _wakeup(wakeup),
      _replies(replies),
      _router(router),
      _relay(socket, peer.user, settings.objectPath, settings.maximumMessage + kMessageOverhead,
             [this](std::string_view message) { return _router.routeOneWay(message); }),
      _bus(openBus(_relay.takeInnerEnd())) {
  checkBus(sd_bus_add_filter(_bus.get(), nullptr, countMessage, &_messagesSeen), "sd_bus_add_filter");
  _replies.open(_bus.get());
}

ConnectionLoop::~ConnectionLoop() { _replies.close(); }

bool ConnectionLoop::isReady() const { return sd_bus_is_ready(_bus.get()) > 0; }

bool ConnectionLoop::isBackedUp() const {
  std::uint64_t queued = 0;
  sd_bus_get_n_queued_write(_bus.get(), &queued);
  return queued > 0;
}

ConnectionLoop::End ConnectionLoop::serve(const std::atomic<bool>& invalidated) {
  const Time deadline = std::chrono::steady_clock::now() + _settings.authenticationTimeout;
  for (;;) {
    if (!sendOutgoing()) return endOfBus();
    if (invalidated.load()) return drain();
    if (!isReady() && std::chrono::steady_clock::now() >= deadline) {
      VESK_LOG_WARNING("ipc: %s: Closed: not authenticated in time", _name.c_str());
      return End::NotAuthenticated;
    }
    wait(deadline);
    if (auto end = advance()) return *end;
  }
}

/// What other threads have answered and called. False when the bus has ended.
bool ConnectionLoop::sendOutgoing() {
  _replies.sendWaiting();
  for (;;) {
    while (isReady() && !isBackedUp() && !_peerGone) {
      auto call = _outbox.take();
      if (!call) break;
      if (!sendCall(*call)) _outbox.lose();
    }
    if (!_relay.passOut() || (!isBackedUp() && _outbox.empty())) return true;
    if (!processWaiting()) return false;
  }
}

/// False when it is lost.
bool ConnectionLoop::sendCall(const IPCOutgoingCall& call) {
  BusMessageHandle message = newCall(_bus.get(), _settings.objectPath, call, false);
  if (!message) return false;  // the bus has ended, which `process` will tell
  BusEncoder encoder(message.get());
  if (!encoder.append(call.arguments)) {
    VESK_LOG_WARNING("ipc: %s: The call %s can't be sent: %s", _name.c_str(), call.member,
                     describe(encoder.result()));
    return false;
  }
  return sd_bus_send(_bus.get(), message.get(), nullptr) >= 0;
}

void ConnectionLoop::wait(Time deadline) {
  pollfd polls[] = {{_socket, 0, 0}, {_wakeup.fd(), POLLIN, 0}};
  if (mayRead()) polls[0].events |= POLLIN;
  if (_relay.isBlocked()) polls[0].events |= POLLOUT;
  int timeout = isReady() ? -1 : untilDeadline(deadline);
  if (_relay.hasHeldMessages() && mayRead()) timeout = 0;
  if (::poll(polls, 2, timeout) <= 0) return;
  // What a client sent before it went away is read even when its answers have nowhere to go.
  if (polls[0].revents & (POLLHUP | POLLERR)) _peerGone = true;
  if (polls[1].revents) _wakeup.clear();
}

bool ConnectionLoop::mayRead() const {
  // sd-bus must have taken BEGIN before it sees a message.
  if (_relay.hasBegun() && !isReady()) return false;
  return !isBackedUp();
}

/// One step: what can be read is handed to the bus, the bus does what it can, what it answers goes out.
std::optional<ConnectionLoop::End> ConnectionLoop::advance() {
  auto outcome = mayRead() ? _relay.takeIn() : BusRelay::Outcome::Nothing;
  // A bus that was given nothing and has nothing to write costs two system calls to ask.
  bool isIdle = outcome == BusRelay::Outcome::Served && !isBackedUp();
  if (!isIdle && !process()) return endOfBus();
  if (_relay.complaint()) VESK_LOG_WARNING("ipc: %s: Closed: %s", _name.c_str(), _relay.complaint());
  if (outcome == BusRelay::Outcome::HungUp || outcome == BusRelay::Outcome::BrokenOff) {
    if (!isReady()) return End::NotAuthenticated;
    return outcome == BusRelay::Outcome::HungUp ? End::HungUp : End::BrokenOff;
  }
  if (_relay.hasBegun() && !isReady()) {
    VESK_LOG_WARNING("ipc: %s: Closed: not authenticated", _name.c_str());
    return End::NotAuthenticated;
  }
  return std::nullopt;
}

/// False when the bus has ended.
bool ConnectionLoop::process() {
  do {
    if (!processWaiting()) return false;
    // Once there is room again the bus writes what it has queued.
  } while (_relay.passOut() && isBackedUp());
  return true;
}

bool ConnectionLoop::processWaiting() {
  // With a full socket before it, sd-bus would not write but serve the next call.
  pollfd socket{sd_bus_get_fd(_bus.get()), POLLOUT, 0};
  if (isBackedUp() && ::poll(&socket, 1, 0) == 0) return true;
  for (;;) {
    sd_bus_message* raw = nullptr;
    int result = sd_bus_process(_bus.get(), &raw);
    BusMessageHandle message(raw);
    if (result < 0) return false;
    if (message) _router.route(raw);
    if (sd_bus_is_open(_bus.get()) <= 0) return false;
    // What is left is served once the client has read: until then nothing more is read from it either.
    if (isBackedUp()) return true;
    if (result == 0) break;
  }
  noteBrokenMessages();
  return true;
}

/// sd-bus drops without a word what has the frame of a message and breaks the rules inside: its sender waits
/// for an answer in vain.
void ConnectionLoop::noteBrokenMessages() {
  if (_messagesSeen == _relay.finishedMessages() || _relay.complaint()) return;
  _messagesSeen = _relay.finishedMessages();
  if (_brokenMessages.begins()) VESK_LOG_WARNING("ipc: %s: Dropped a broken message", _name.c_str());
}

ConnectionLoop::End ConnectionLoop::endOfBus() const {
  return _relay.hasBegun() ? End::BrokenOff : End::NotAuthenticated;
}

ConnectionLoop::End ConnectionLoop::drain() {
  int waiting = 0;
  if (!isReady() || ::ioctl(_socket, FIONREAD, &waiting) != 0) return End::Invalidated;
  const std::size_t target = _relay.received() + static_cast<std::size_t>(waiting);
  const Time deadline = std::chrono::steady_clock::now() + kDrainTime;
  while (_relay.received() < target && mayRead() && std::chrono::steady_clock::now() < deadline) {
    if (advance()) break;
  }
  return End::Invalidated;
}

void ConnectionLoop::flush(std::chrono::milliseconds limit) {
  const Time deadline = std::chrono::steady_clock::now() + limit;
  while (isReady() && !_peerGone && std::chrono::steady_clock::now() < deadline) {
    if (!sendOutgoing() || !process()) return;
    if (!isBackedUp() && _outbox.empty() && !_relay.isBlocked()) return;
    pollfd poll{_socket, POLLOUT, 0};
    if (::poll(&poll, 1, untilDeadline(deadline)) <= 0 || (poll.revents & (POLLHUP | POLLERR))) return;
  }
}

}  // namespace vesk
