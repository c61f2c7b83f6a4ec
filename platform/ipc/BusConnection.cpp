#include "platform/ipc/BusConnection.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <thread>

#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/log/LogUser.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

std::string nameFor(std::uint64_t serial, const IPCPeer& peer) {
  return "connection " + std::to_string(serial) + " (user " + std::to_string(peer.user) + ", process " +
         std::to_string(peer.process) + ")";
}

/// Milliseconds until `deadline` for poll(), rounded up so that it has passed when poll() returns.
int untilDeadline(std::chrono::steady_clock::time_point deadline) {
  auto left =
      std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::clamp<long long>(left, 0, 1'000'000));
}

}  // namespace

BusConnection::BusConnection(FileDescriptor socket, std::uint64_t serial, const IPCPeer& peer,
                             std::shared_ptr<ConnectionRegistry> registry)
    : _serial(serial),
      _peer(peer),
      _name(nameFor(serial, peer)),
      _registry(std::move(registry)),
      _outbox(std::make_shared<Outbox>(_registry->options.maximumOutbox,
                                       [wakeup = _wakeup] { wakeup->signal(); })),
      _socket(std::move(socket)),
      _router(_registry->options.objectPath, _name, _outbox, {serial, peer.user},
              {.content = _registry->options.maximumMessage}),
      _sasl(peer.user),
      _channel(_socket.get(), _registry->options.maximumMessage + kMessageOverhead) {}

void BusConnection::resume(IPCHandlers handlers) {
  if (_started.exchange(true)) return;
  _router.setExportedObject(std::move(handlers.object), std::move(handlers.otherObjects));
  _handlers = std::move(handlers);
  try {
    _registry->launch([self = shared_from_this()] { self->run(); });
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: %s: Closed: %s", _name.c_str(), error.what());
    finish(End::NotAuthenticated);
    close();
  }
}

void BusConnection::setPaused(bool isPaused) {
  _paused.store(isPaused);
  if (!isPaused) _wakeup->signal();
}

void BusConnection::invalidate() {
  _invalidated.store(true);
  _wakeup->signal();
}

void BusConnection::end() {
  invalidate();
  if (_started.exchange(true)) return;
  _outbox->close();
  close();
}

void BusConnection::callRemoteObject(IPCOutgoingCall call,
                                     const std::function<void(const std::string& error)>& errorHandler) {
  std::string message;
  const auto result = appendCall(_registry->options.objectPath, call, message);
  const char* error = result == CodecResult::Ok              ? _outbox->put(std::move(message))
                      : result == CodecResult::LimitExceeded ? "the call is too large"
                                                             : describe(result);
  if (error && errorHandler) errorHandler(error);
}

// --- On the connection's thread

void BusConnection::run() noexcept {
  LogUser onBehalfOf(_peer.user);
  auto how = End::BrokenOff;
  try {
    how = serve();
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: %s: Closed: %s", _name.c_str(), error.what());
  }
  finish(how);
  // After the bus; other holders of this connection don't keep its socket open.
  close();
}

BusConnection::End BusConnection::serve() {
  const Time deadline = std::chrono::steady_clock::now() + _registry->options.authenticationTimeout;
  _outbox->setThread(std::this_thread::get_id());
  for (;;) {
    sendOutgoing();
    if (_invalidated.load()) return drain();
    if (_outbox->isBroken()) return closeFor("an answer is lost");
    if (!_isReady && std::chrono::steady_clock::now() >= deadline) {
      VESK_LOG_WARNING("ipc: %s: Closed: not authenticated in time", _name.c_str());
      return End::NotAuthenticated;
    }
    wait(deadline);
    if (auto end = advance()) return *end;
  }
}

/// Sends pending answers and calls of all threads with one system call.
void BusConnection::sendOutgoing() {
  _outbox->moveAnswersTo(_channel);
  while (_isReady && !_peerGone && _channel.unsentBytes() < kMaximumUnsent) {
    const std::string call = _outbox->takeCall();
    if (call.empty()) break;
    _channel.output() += call;
    _channel.queued();
  }
  if (_handlers.beforeSending && isBackedUp()) callHandler(_handlers.beforeSending);
  // Calls that the client sent before it disconnected are still served, so this doesn't end the connection.
  if (!_channel.flush()) _peerGone = true;
  if (_peerGone) _channel.dropOutput();
}

void BusConnection::wait(Time deadline) {
  if (_hasMore && !mustWait()) return;
  const auto wanted = static_cast<short>(isBackedUp() ? POLLOUT : mustWait() ? 0 : POLLIN);
  pollfd polls[] = {{_socket.get(), wanted, 0}, {_wakeup->fd(), POLLIN, 0}};
  if (::poll(polls, 2, _isReady ? -1 : untilDeadline(deadline)) <= 0) return;
  if (polls[0].revents & (POLLHUP | POLLERR)) {
    _peerGone = true;
    _channel.dropOutput();
  }
  if (polls[1].revents) _wakeup->clear();
}

BusConnection::End BusConnection::closeFor(const char* complaint) {
  if (complaint) VESK_LOG_WARNING("ipc: %s: Closed: %s", _name.c_str(), complaint);
  return _isReady ? End::BrokenOff : End::NotAuthenticated;
}

/// Performs one step: reads what has arrived and serves it.
std::optional<BusConnection::End> BusConnection::advance() {
  if (mustWait()) return std::nullopt;
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

std::optional<BusConnection::End> BusConnection::authenticate() {
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

std::optional<BusConnection::End> BusConnection::serveMessages() {
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
        _outbox->moveAnswersTo(_channel);
        if (message.hasDescriptors()) return closeFor("descriptors that no call takes");
        break;
    }
    const bool mustSend = _channel.unsentBytes() > kMaximumUnsent;
    if (mustSend) sendOutgoing();
    // The rest is served later, and until then nothing more is read.
    if ((mustSend && isBackedUp()) || _paused.load()) {
      _hasMore = true;
      return std::nullopt;
    }
  }
}

BusConnection::End BusConnection::drain() {
  int waiting = 0;
  if (!_isReady || ::ioctl(_socket.get(), FIONREAD, &waiting) != 0) return End::Invalidated;
  const std::size_t target = _channel.received() + static_cast<std::size_t>(waiting);
  const Time deadline = std::chrono::steady_clock::now() + kDrainTime;
  while ((_hasMore || _channel.received() < target) && !isBackedUp() &&
         std::chrono::steady_clock::now() < deadline) {
    if (advance()) break;
    sendOutgoing();
  }
  return End::Invalidated;
}

void BusConnection::flush() {
  const Time deadline = std::chrono::steady_clock::now() + kFlushTime;
  while (_isReady && !_peerGone && std::chrono::steady_clock::now() < deadline) {
    sendOutgoing();
    if (!isBackedUp()) {
      if (!_outbox->hasCalls()) return;
      continue;
    }
    pollfd poll{_socket.get(), POLLOUT, 0};
    if (::poll(&poll, 1, untilDeadline(deadline)) <= 0 || (poll.revents & (POLLHUP | POLLERR))) return;
  }
}

void BusConnection::finish(End how) noexcept {
  // A disconnected client accepts no calls; an invalidated one still gets what its session sends at the end.
  std::size_t lost = how == End::Invalidated ? 0 : _outbox->close();
  if (how == End::BrokenOff) callHandler(_handlers.interruption);
  callHandler(_handlers.invalidation);
  dropHandlers();
  if (how == End::Invalidated) flush();
  if (std::size_t unsent = _outbox->close()) {
    VESK_LOG_WARNING("ipc: %s: Ended before %zu calls to the client were sent", _name.c_str(), unsent);
    lost += unsent;
  }
  if (lost > 0 && _handlers.loss) callHandler([&] { _handlers.loss(lost); });
}

void BusConnection::callHandler(const std::function<void()>& handler) noexcept {
  if (!handler) return;
  try {
    handler();
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: %s: A handler failed: %s", _name.c_str(), error.what());
  }
}

void BusConnection::dropHandlers() noexcept {
  // Moved out first, because destroying them may call this connection.
  auto interruption = std::exchange(_handlers.interruption, nullptr);
  auto invalidation = std::exchange(_handlers.invalidation, nullptr);
  auto beforeSending = std::exchange(_handlers.beforeSending, nullptr);
  auto objects = _router.takeExportedObjects();
}

void BusConnection::close() noexcept {
  if (!_counted.exchange(false)) return;
  _outbox->close();
  _socket.reset();
  ExtensionTokens::shared().drop(_serial);
  _registry->release(_serial);
}

}  // namespace vesk
