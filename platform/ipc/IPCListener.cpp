#include "platform/ipc/IPCListener.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <cerrno>
#include <system_error>

#include "platform/ipc/BusConnection.h"
#include "platform/ipc/ConnectionRegistry.h"
#include "platform/ipc/UnixSocket.h"
#include "platform/ipc/WireFormat.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// Pause after running out of a kernel resource: accept() fails immediately until it is available again.
constexpr int kPauseMilliseconds = 100;

FileDescriptor anyDescriptor() { return FileDescriptor(::eventfd(0, EFD_CLOEXEC)); }

/// A listening socket opened by the service manager.
FileDescriptor checkedInherited(FileDescriptor socket) {
  int domain = 0;
  int listens = 0;
  socklen_t size = sizeof domain;
  bool known = ::getsockopt(socket.get(), SOL_SOCKET, SO_DOMAIN, &domain, &size) == 0 &&
               ::getsockopt(socket.get(), SOL_SOCKET, SO_ACCEPTCONN, &listens, &size) == 0;
  if (!known || domain != AF_UNIX || !listens) {
    throw std::system_error(EINVAL, std::generic_category(),
                            "The inherited socket is no listening Unix socket");
  }
  ::fcntl(socket.get(), F_SETFD, FD_CLOEXEC);
  ::fcntl(socket.get(), F_SETFL, ::fcntl(socket.get(), F_GETFL) | O_NONBLOCK);
  return socket;
}

}  // namespace

IPCListener::IPCListener(Options options)
    : _madePath(options.inherited ? std::string() : options.socketPath),
      _listening(options.inherited ? checkedInherited(std::move(options.inherited))
                                   : listenOnUnixSocket(options.socketPath)),
      _registry(std::make_shared<ConnectionRegistry>(std::move(options))),
      _reserve(anyDescriptor()) {
  if (!_madePath.empty()) ::stat(_madePath.c_str(), &_madeSocket);
}

void IPCListener::resume() {
  if (_stopping || _thread.joinable()) return;
  _thread = std::thread([this] { run(); });
  pthread_setname_np(_thread.native_handle(), "vesk-listener");
}

bool IPCListener::stop(std::chrono::steady_clock::time_point deadline) {
  _stopping = true;
  _wakeup.signal();
  if (_thread.joinable()) _thread.join();
  removeSocket();
  _listening.reset();
  for (const auto& connection : _registry->connections()) connection->end();
  return _registry->waitForThreads(deadline);
}

/// Removes only the socket that this listener created, since another daemon may have taken over the path.
void IPCListener::removeSocket() {
  struct stat now {};
  if (!_listening || _madePath.empty() || ::lstat(_madePath.c_str(), &now) != 0) return;
  if (now.st_dev == _madeSocket.st_dev && now.st_ino == _madeSocket.st_ino) ::unlink(_madePath.c_str());
}

void IPCListener::run() {
  bool pause = false;
  while (!_stopping) {
    pollfd polls[] = {
        {_listening.get(), static_cast<short>(pause ? 0 : POLLIN), 0},
        {_wakeup.fd(), POLLIN, 0},
    };
    ::poll(polls, 2, pause ? kPauseMilliseconds : -1);
    auto accepted = Accepted::Yes;
    while (!_stopping && accepted == Accepted::Yes) accepted = acceptOne();
    pause = accepted == Accepted::NoRoom;
  }
}

IPCListener::Accepted IPCListener::acceptOne() {
  FileDescriptor socket(::accept4(_listening.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (socket) {
    admit(std::move(socket));
    return Accepted::Yes;
  }
  switch (errno) {
    case EAGAIN:
      return Accepted::NoneWaiting;
    case EMFILE:
    case ENFILE:
      return refuseForWantOfDescriptors();
    case EINTR:
    case ECONNABORTED:  // the client disconnected before it was accepted
      return Accepted::Yes;
    default:
      return Accepted::NoRoom;
  }
}

IPCListener::Accepted IPCListener::refuseForWantOfDescriptors() {
  _reserve.reset();
  FileDescriptor socket(::accept4(_listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
  bool refused = static_cast<bool>(socket);
  socket.reset();
  _reserve = anyDescriptor();
  if (_refusals.begins()) VESK_LOG_WARNING("ipc: Refused a connection: no descriptor is left");
  return refused ? Accepted::Yes : Accepted::NoRoom;
}

void IPCListener::admit(FileDescriptor socket) {
  IPCPeer peer;
  try {
    peer = peerOfSocket(socket.get());
  } catch (const std::system_error& error) {
    VESK_LOG_WARNING("ipc: Refused a connection: %s", error.what());
    return;
  }
  static std::atomic<std::uint64_t> lastSerial{0};
  const std::uint64_t serial = ++lastSerial;
  const auto admission = _registry->admit(serial, peer.user);
  if (admission == ConnectionRegistry::Admission::Admitted) return introduce(std::move(socket), serial, peer);
  // Doesn't block: the socket is new, so one line fits.
  const std::string line = std::string(kTooManyConnections) + "\r\n";
  ::send(socket.get(), line.data(), line.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  if (_refusals.begins()) {
    VESK_LOG_WARNING("ipc: Refused a connection of user %u: too many are open%s", peer.user,
                     admission == ConnectionRegistry::Admission::TooManyOfUser ? " for that user" : "");
  }
}

void IPCListener::introduce(FileDescriptor socket, std::uint64_t serial, const IPCPeer& peer) {
  std::shared_ptr<BusConnection> connection;
  try {
    connection = std::make_shared<BusConnection>(std::move(socket), serial, peer, _registry);
    _registry->add(serial, connection);
    if (!_delegate || !_delegate->shouldAcceptNewConnection(connection)) connection->end();
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: Refused a connection: %s", error.what());
    connection ? connection->end() : _registry->release(serial);
  }
}

std::size_t IPCListener::connectionCount() const { return _registry->count(); }

}  // namespace vesk
