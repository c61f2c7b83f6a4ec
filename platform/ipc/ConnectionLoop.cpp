#include "platform/ipc/ConnectionLoop.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <thread>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

/// Milliseconds for poll() until `deadline`, rounded up so that it has passed when poll() returns.
int untilDeadline(std::chrono::steady_clock::time_point deadline) {
  auto left =
      std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::clamp<long long>(left, 0, 1'000'000));
}

}  // namespace

ConnectionLoop::ConnectionLoop(int socket, const IPCPeer& peer, const std::string& name,
                               const ConnectionSettings& settings, Outbox& outbox, const Wakeup& wakeup,
                               Answers& answers, CallRouter& router) noexcept
    : _socket(socket),
      _name(name),
      _settings(settings),
      _outbox(outbox),
      _wakeup(wakeup),
      _answers(answers),
      _router(router),
      _writer(settings.objectPath),
      _sasl(peer.user),
      _channel(socket, settings.maximumMessage + kMessageOverhead) {}

ConnectionLoop::~ConnectionLoop() { _answers.close(); }

ConnectionLoop::End ConnectionLoop::serve(const std::atomic<bool>& invalidated) {
  const Time deadline = std::chrono::steady_clock::now() + _settings.authenticationTimeout;
  _answers.setThread(std::this_thread::get_id());
  for (;;) {
    sendOutgoing();
    if (invalidated.load()) return drain();
    if (_answers.isBroken()) return closeFor("an answer is lost");
    if (!_isReady && std::chrono::steady_clock::now() >= deadline) {
      VESK_LOG_WARNING("ipc: %s: Closed: not authenticated in time", _name.c_str());
      return End::NotAuthenticated;
    }
    wait(deadline);
    if (auto end = advance()) return *end;
  }
}

/// What this thread and others have answered and called, with one system call.
void ConnectionLoop::sendOutgoing() {
  _answers.moveTo(_channel);
  while (_isReady && !_peerGone && _channel.unsentBytes() < kMaximumUnsent) {
    auto call = _outbox.take();
    if (!call) break;
    if (!appendCall(*call)) _outbox.lose();
  }
  // What the client had sent before it went is served all the same, so its going is no end here.
  if (!_channel.flush()) _peerGone = true;
  if (_peerGone) _channel.dropOutput();
}

bool ConnectionLoop::appendCall(const IPCOutgoingCall& call) {
  const auto result = _writer.append(call, ++_lastSerial, false, _channel.output());
  if (result == CodecResult::Ok) {
    _channel.queued();
    return true;
  }
  VESK_LOG_WARNING("ipc: %s: The call %s can't be sent: %s", _name.c_str(), call.member, describe(result));
  return false;
}

void ConnectionLoop::wait(Time deadline) {
  if (_hasMore && mayRead()) return;
  pollfd polls[] = {{_socket, static_cast<short>(mayRead() ? POLLIN : POLLOUT), 0},
                    {_wakeup.fd(), POLLIN, 0}};
  if (::poll(polls, 2, _isReady ? -1 : untilDeadline(deadline)) <= 0) return;
  if (polls[0].revents & (POLLHUP | POLLERR)) {
    _peerGone = true;
    _channel.dropOutput();
  }
  if (polls[1].revents) _wakeup.clear();
}

ConnectionLoop::End ConnectionLoop::closeFor(const char* complaint) {
  if (complaint) VESK_LOG_WARNING("ipc: %s: Closed: %s", _name.c_str(), complaint);
  return _isReady ? End::BrokenOff : End::NotAuthenticated;
}

/// One step: reads what has come, and serves it.
std::optional<ConnectionLoop::End> ConnectionLoop::advance() {
  if (!mayRead()) return std::nullopt;
  if (!_hasMore) {
    switch (_channel.receive()) {
      case Channel::Input::Nothing:
        return std::nullopt;
      case Channel::Input::HungUp:
        return _isReady ? End::HungUp : End::NotAuthenticated;
      case Channel::Input::BrokenOff:
        return closeFor(_channel.complaint());
      case Channel::Input::Some:
        break;
    }
  }
  if (!_isReady) {
    if (auto end = authenticate()) return end;
    if (!_isReady) return std::nullopt;
  }
  return serveMessages();
}

std::optional<ConnectionLoop::End> ConnectionLoop::authenticate() {
  auto step = _sasl.step(_channel.bytes());
  if (step.verdict == SaslServer::Verdict::Refused) return closeFor("no D-Bus authentication");
  _channel.skip(step.taken);
  if (!step.answer.empty()) {
    _channel.output() += step.answer;
    _channel.queued();
  }
  _isReady = step.verdict == SaslServer::Verdict::Begun;
  if (!_isReady && _channel.hasDescriptors()) return closeFor("a descriptor before authentication");
  return std::nullopt;
}

std::optional<ConnectionLoop::End> ConnectionLoop::serveMessages() {
  for (;;) {
    Message message;
    _hasMore = false;
    switch (_channel.next(message)) {
      case Channel::Next::Incomplete:
        return std::nullopt;
      case Channel::Next::Refused:
        return closeFor(_channel.complaint());
      case Channel::Next::Dropped:
        if (_brokenMessages.begins()) VESK_LOG_WARNING("ipc: %s: Dropped a broken message", _name.c_str());
        break;
      case Channel::Next::Whole:
        _router.route(message);
        _answers.moveTo(_channel);
        if (message.hasDescriptors()) return closeFor("descriptors that no call takes");
        break;
    }
    if (_channel.unsentBytes() > kMaximumUnsent) {
      sendOutgoing();
      // What is left is served once the client has read: until then nothing more is read from it either.
      _hasMore = true;
      if (isBackedUp()) return std::nullopt;
    }
  }
}

ConnectionLoop::End ConnectionLoop::drain() {
  int waiting = 0;
  if (!_isReady || ::ioctl(_socket, FIONREAD, &waiting) != 0) return End::Invalidated;
  const std::size_t target = _channel.received() + static_cast<std::size_t>(waiting);
  const Time deadline = std::chrono::steady_clock::now() + kDrainTime;
  while ((_hasMore || _channel.received() < target) && mayRead() &&
         std::chrono::steady_clock::now() < deadline) {
    if (advance()) break;
    sendOutgoing();
  }
  return End::Invalidated;
}

void ConnectionLoop::flush(std::chrono::milliseconds limit) {
  const Time deadline = std::chrono::steady_clock::now() + limit;
  while (_isReady && !_peerGone && std::chrono::steady_clock::now() < deadline) {
    sendOutgoing();
    if (!isBackedUp()) {
      if (_outbox.empty()) return;
      continue;
    }
    pollfd poll{_socket, POLLOUT, 0};
    if (::poll(&poll, 1, untilDeadline(deadline)) <= 0 || (poll.revents & (POLLHUP | POLLERR))) return;
  }
}

}  // namespace vesk
