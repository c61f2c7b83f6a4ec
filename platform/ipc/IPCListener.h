// Accepts clients on the daemon's Unix socket.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

class IPCListenerDelegate {
 public:
  virtual ~IPCListenerDelegate() = default;
  /// Called on the listener's thread for each new connection, which is not resumed yet. Returning false
  /// closes it.
  virtual bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) = 0;
};

class IPCListener {
 public:
  struct Options {
    std::string socketPath;    ///< made (mode 0666, its directory 0755) unless `inherited` is given
    FileDescriptor inherited;  ///< a listening socket from the service manager
    std::string objectPath;    ///< where a connection's exported object stands
    std::size_t maximumConnections = 4096;  ///< the last sixteen (of few, an eighth) are kept for root
    std::size_t maximumConnectionsPerUser = 1024;
    std::size_t maximumMessage = std::size_t{1} << 20;  ///< bytes
    std::size_t maximumOutbox = 256;                    ///< calls to one client that wait
    std::chrono::milliseconds authenticationTimeout{5'000};
  };

  /// Binds the socket. Throws std::system_error when it can't.
  explicit IPCListener(Options options);
  /// As `stop`.
  ~IPCListener();

  /// Not owned; outlives the listener. Set before `resume`.
  void setDelegate(IPCListenerDelegate* delegate);
  /// Begins to accept, on the listener's own thread.
  void resume();
  /// No further connection is accepted; those that are open get invalidated, and this waits until every
  /// connection's thread has ended (invalidation handlers included). Safe before `resume` and twice; not from
  /// a connection's thread.
  void stop();
  /// The same, but waits no longer than that. False when a thread still runs: then neither this nor what its
  /// handlers use may be destroyed.
  [[nodiscard]] bool stopWithin(std::chrono::milliseconds patience);

  std::size_t connectionCount() const;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace vesk
