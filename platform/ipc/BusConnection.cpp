#include "platform/ipc/BusConnection.h"

#include "platform/ipc/ExtensionTokens.h"
#include "platform/log/LogUser.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

std::uint64_t nextSerial() {
  static std::atomic<std::uint64_t> last{0};
  return ++last;
}

std::string nameFor(std::uint64_t serial, const IPCPeer& peer) {
  return "connection " + std::to_string(serial) + " (user " + std::to_string(peer.user) + ", process " +
         std::to_string(peer.process) + ")";
}

}  // namespace

BusConnection::BusConnection(FileDescriptor socket, const IPCPeer& peer, const ConnectionSettings& settings,
                             std::shared_ptr<ConnectionRegistry> registry)
    : _serial(nextSerial()),
      _peer(peer),
      _settings(settings),
      _name(nameFor(_serial, peer)),
      _registry(std::move(registry)),
      _wakeup(std::make_shared<Wakeup>()),
      _answers(std::make_shared<Answers>([wakeup = _wakeup] { wakeup->signal(); })),
      _outbox(settings.maximumOutbox),
      _socket(std::move(socket)),
      _router(settings.objectPath, _name, _answers, {_serial, _peer.user},
              {.content = settings.maximumMessage}) {}

BusConnection::~BusConnection() { close(); }

void BusConnection::setExportedObject(std::shared_ptr<IPCExportedObject> object) {
  _router.setExportedObject(std::move(object));
}

void BusConnection::setInterruptionHandler(std::function<void()> handler) {
  _interruptionHandler = std::move(handler);
}

void BusConnection::setInvalidationHandler(std::function<void()> handler) {
  _invalidationHandler = std::move(handler);
}

void BusConnection::setLossHandler(std::function<void(std::size_t calls)> handler) {
  _lossHandler = std::move(handler);
}

void BusConnection::resume() {
  {
    MutexLock lock(_mutex);
    if (std::exchange(_started, true)) return;
  }
  try {
    _registry->launch([self = shared_from_this()] { self->run(); });
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: %s: Closed: %s", _name.c_str(), error.what());
    finish(ConnectionLoop::End::NotAuthenticated, nullptr);
    close();
  }
}

void BusConnection::invalidate() {
  _invalidated.store(true);
  _wakeup->signal();
}

void BusConnection::end() {
  invalidate();
  {
    MutexLock lock(_mutex);
    if (std::exchange(_started, true)) return;
  }
  _outbox.close();
  LogUser onBehalfOf(_peer.user);
  dropHandlers();
  close();
}

void BusConnection::callRemoteObject(IPCOutgoingCall call,
                                     const std::function<void(const std::string& error)>& errorHandler) {
  if (const char* error = _outbox.put(std::move(call))) {
    if (errorHandler) errorHandler(error);
    return;
  }
  _wakeup->signal();
}

void BusConnection::run() noexcept {
  LogUser onBehalfOf(_peer.user);
  try {
    ConnectionLoop loop(_socket.get(), _peer, _name, _settings, _outbox, *_wakeup, *_answers, _router);
    finish(loop.serve(_invalidated), &loop);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: %s: Closed: %s", _name.c_str(), error.what());
    finish(ConnectionLoop::End::BrokenOff, nullptr);
  }
  // After the bus; whoever still holds this connection does not hold its socket open.
  close();
}

void BusConnection::finish(ConnectionLoop::End how, ConnectionLoop* loop) noexcept {
  // A client that has gone takes no call; one that is sent away still gets what its session says in the end.
  std::size_t lost = how == ConnectionLoop::End::Invalidated ? 0 : _outbox.close();
  if (how == ConnectionLoop::End::BrokenOff) callHandler(_interruptionHandler);
  callHandler(_invalidationHandler);
  dropHandlers();
  if (loop && how == ConnectionLoop::End::Invalidated) loop->flush(kFlushTime);
  if (std::size_t unsent = _outbox.close()) {
    VESK_LOG_WARNING("ipc: %s: Ended before %zu calls to the client were sent", _name.c_str(), unsent);
    lost += unsent;
  }
  if (lost > 0 && _lossHandler) callHandler([&] { _lossHandler(lost); });
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
  // Moved out first: what goes with them may call this connection.
  auto interruption = std::exchange(_interruptionHandler, nullptr);
  auto invalidation = std::exchange(_invalidationHandler, nullptr);
  auto object = _router.takeExportedObject();
}

void BusConnection::close() noexcept {
  if (!_counted.exchange(false)) return;
  _socket.reset();
  ExtensionTokens::shared().drop(_serial);
  _registry->remove(_serial);
  _registry->release(_peer.user);
}

}  // namespace vesk
