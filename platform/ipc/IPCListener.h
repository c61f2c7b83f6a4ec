// Accepts clients on the daemon's Unix socket.
#pragma once

#include <sys/stat.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <thread>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Wakeup.h"

namespace vesk {

class ConnectionRegistry;

class IPCListenerDelegate {
 public:
  virtual ~IPCListenerDelegate() = default;
  /// Called on the listener's thread for each new connection, before it is resumed. Return false to close it.
  virtual bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) = 0;
};

class IPCListener {
 public:
  struct Options {
    std::string socketPath;    ///< created (mode 0666, its directory 0755) unless `inherited` is given
    FileDescriptor inherited;  ///< a listening socket from the service manager
    std::string objectPath;    ///< the path of a connection's exported object
    std::size_t maximumConnections = 4096;  ///< the last 16 (of a small limit, an eighth) are kept for root
    std::size_t maximumConnectionsPerUser = 1024;
    std::size_t maximumMessage = std::size_t{1} << 20;  ///< bytes
    std::size_t maximumOutbox = 256;                    ///< calls to one client that may wait
    std::chrono::milliseconds authenticationTimeout{5'000};
  };

  /// Binds the socket. Throws std::system_error on failure.
  explicit IPCListener(Options options);
  /// Calls `stop`.
  ~IPCListener() { stop(); }

  /// Not owned; outlives the listener. Set before `resume`.
  void setDelegate(IPCListenerDelegate* delegate) { _delegate = delegate; }
  /// Starts accepting, on the listener's own thread.
  void resume();
  /// Stops accepting connections, invalidates the open ones and waits until every connection's thread has
  /// ended, including invalidation handlers. May be called before `resume` and repeatedly. Must not be called
  /// on a connection's thread.
  void stop() { stop(std::chrono::steady_clock::time_point::max()); }
  /// As above, but waits no longer than `patience`. Returns false if a thread still runs; then neither the
  /// listener nor anything its handlers use may be destroyed.
  [[nodiscard]] bool stopWithin(std::chrono::milliseconds patience) {
    return stop(std::chrono::steady_clock::now() + patience);
  }

  std::size_t connectionCount() const;

 private:
  enum class Accepted { Yes, NoneWaiting, NoRoom };

  bool stop(std::chrono::steady_clock::time_point deadline);
  void run();
  Accepted acceptOne();
  Accepted refuseForWantOfDescriptors();
  void admit(FileDescriptor socket);
  void introduce(FileDescriptor socket, std::uint64_t serial, const IPCPeer& peer);
  void removeSocket();

  const std::string _madePath;  // empty for an inherited socket
  struct stat _madeSocket {};
  FileDescriptor _listening;
  const std::shared_ptr<ConnectionRegistry> _registry;
  FileDescriptor _reserve;  // closed temporarily, to accept and close a connection when descriptors run out
  Wakeup _wakeup;
  std::atomic<bool> _stopping{false};
  IPCListenerDelegate* _delegate = nullptr;
  WarningBurst _refusals;
  std::thread _thread;
};

}  // namespace vesk
