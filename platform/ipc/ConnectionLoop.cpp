#include "platform/ipc/ConnectionLoop.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <system_error>

#include "platform/ipc/BusCodec.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

void check(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), what);
}

/// Milliseconds for poll() until `deadline`, rounded up so that it has passed when poll() returns.
int untilDeadline(std::chrono::steady_clock::time_point deadline) {
  auto left =
      std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::clamp<long long>(left, 0, 1'000'000));
}

/// A server's bus that reads from `input` and writes to a duplicate of `socket`.
BusHandle openBus(FileDescriptor input, int socket) {
  FileDescriptor output(::fcntl(socket, F_DUPFD_CLOEXEC, 3));
  if (!output) throw std::system_error(errno, std::generic_category(), "F_DUPFD_CLOEXEC");
  sd_bus* raw = nullptr;
  check(sd_bus_new(&raw), "sd_bus_new");
  BusHandle bus(raw);
  check(sd_bus_set_fd(raw, input.get(), output.get()), "sd_bus_set_fd");
  static_cast<void>(input.release());
  static_cast<void>(output.release());
  sd_id128_t identity{};
  check(sd_id128_randomize(&identity), "sd_id128_randomize");
  check(sd_bus_set_server(raw, 1, identity), "sd_bus_set_server");
  check(sd_bus_negotiate_fds(raw, 1), "sd_bus_negotiate_fds");
  check(sd_bus_start(raw), "sd_bus_start");
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
      _feed(socket, peer.user, settings.maximumMessage + kMessageOverhead),
      _bus(openBus(_feed.takeInnerEnd(), socket)) {
  _replies.open(_bus.get(), socket);
}

ConnectionLoop::~ConnectionLoop() { _replies.close(); }

bool ConnectionLoop::isReady() const { return sd_bus_is_ready(_bus.get()) > 0; }

std::size_t ConnectionLoop::unread() const {
  std::uint64_t queued = 0;
  sd_bus_get_n_queued_write(_bus.get(), &queued);
  return queued;
}

ConnectionLoop::End ConnectionLoop::serve(const std::atomic<bool>& invalidated) {
  const Time deadline = std::chrono::steady_clock::now() + _settings.authenticationTimeout;
  for (;;) {
    sendOutgoing();
    if (invalidated.load()) return drain();
    if (!isReady() && std::chrono::steady_clock::now() >= deadline) {
      VESK_LOG_WARNING("ipc: %s: Closed: not authenticated in time", _name.c_str());
      return End::NotAuthenticated;
    }
    wait(deadline);
    if (auto end = advance()) return *end;
  }
}

void ConnectionLoop::sendOutgoing() {
  _replies.sendWaiting();
  while (isReady() && unread() <= kMaximumUnread) {
    auto call = _outbox.take();
    if (!call) return;
    sendCall(*call);
  }
}

void ConnectionLoop::sendCall(const IPCOutgoingCall& call) {
  sd_bus_message* raw = nullptr;
  if (sd_bus_message_new_method_call(_bus.get(), &raw, nullptr, _settings.objectPath.c_str(),
                                     call.interfaceName, call.member) < 0) {
    return;  // the bus has ended, which `process` will tell
  }
  BusMessageHandle message(raw);
  sd_bus_message_set_expect_reply(raw, 0);
  BusEncoder encoder(raw);
  for (const auto& argument : call.arguments) encoder.append(argument);
  if (!encoder.ok()) {
    VESK_LOG_WARNING("ipc: %s: The call %s can't be sent: %s", _name.c_str(), call.member,
                     describe(encoder.result()));
    return;
  }
  sd_bus_send(_bus.get(), raw, nullptr);
}

void ConnectionLoop::wait(Time deadline) {
  int wanted = sd_bus_get_events(_bus.get());
  pollfd polls[] = {{_socket, 0, 0}, {_wakeup.fd(), POLLIN, 0}};
  if (mayRead()) polls[0].events |= POLLIN;
  if (wanted > 0 && (wanted & POLLOUT)) polls[0].events |= POLLOUT;
  int timeout = isReady() ? -1 : untilDeadline(deadline);
  if (_feed.hasHeldMessages() && mayRead()) timeout = 0;
  if (::poll(polls, 2, timeout) <= 0) return;
  // What a client sent before it went away is read even when its answers have nowhere to go.
  if (polls[0].revents & (POLLHUP | POLLERR)) _peerGone = true;
  if (polls[1].revents) _wakeup.clear();
}

bool ConnectionLoop::mayRead() const {
  // sd-bus must have taken BEGIN before it sees a message.
  if (_feed.hasBegun() && !isReady()) return false;
  return _peerGone || unread() <= kMaximumUnread;
}

/// One step: what can be read is handed to the bus, and the bus does what it can.
std::optional<ConnectionLoop::End> ConnectionLoop::advance() {
  auto outcome = mayRead() ? _feed.pump() : BusFeed::Outcome::Nothing;
  if (!process()) return endOfBus();
  if (_feed.complaint()) VESK_LOG_WARNING("ipc: %s: Closed: %s", _name.c_str(), _feed.complaint());
  if (outcome == BusFeed::Outcome::HungUp || outcome == BusFeed::Outcome::BrokenOff) {
    if (!isReady()) return End::NotAuthenticated;
    return outcome == BusFeed::Outcome::HungUp ? End::HungUp : End::BrokenOff;
  }
  bool wantsToWrite = sd_bus_get_events(_bus.get()) & POLLOUT;
  if (_feed.hasBegun() && !isReady() && (_peerGone || !wantsToWrite)) {
    VESK_LOG_WARNING("ipc: %s: Closed: not authenticated", _name.c_str());
    return End::NotAuthenticated;
  }
  return std::nullopt;
}

/// False when the bus has ended.
bool ConnectionLoop::process() {
  for (;;) {
    sd_bus_message* raw = nullptr;
    int result = sd_bus_process(_bus.get(), &raw);
    BusMessageHandle message(raw);
    if (result < 0) return false;
    if (message) _router.route(raw);
    if (sd_bus_is_open(_bus.get()) <= 0) return false;
    if (result == 0) return true;
  }
}

ConnectionLoop::End ConnectionLoop::endOfBus() const {
  if (!_feed.hasBegun()) return End::NotAuthenticated;
  return _feed.insideMessage() ? End::BrokenOff : End::HungUp;
}

ConnectionLoop::End ConnectionLoop::drain() {
  int waiting = 0;
  if (!isReady() || ::ioctl(_socket, FIONREAD, &waiting) != 0) return End::Invalidated;
  const std::size_t target = _feed.received() + static_cast<std::size_t>(waiting);
  const Time deadline = std::chrono::steady_clock::now() + kDrainTime;
  while (_feed.received() < target && std::chrono::steady_clock::now() < deadline && !advance()) {
  }
  return End::Invalidated;
}

void ConnectionLoop::flush(std::chrono::milliseconds limit) {
  const Time deadline = std::chrono::steady_clock::now() + limit;
  while (sd_bus_is_open(_bus.get()) > 0 && isReady()) {
    sendOutgoing();
    if (unread() == 0 && _outbox.empty()) return;
    pollfd poll{_socket, POLLOUT, 0};
    if (::poll(&poll, 1, untilDeadline(deadline)) <= 0 || (poll.revents & (POLLHUP | POLLERR))) return;
    if (!process() || std::chrono::steady_clock::now() >= deadline) return;
  }
}

}  // namespace vesk
