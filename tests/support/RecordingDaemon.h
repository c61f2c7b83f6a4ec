// The daemon's end of the protocol, on real sockets, with sessions that only record calls.
#pragma once

#include "platform/ipc/IPCListener.h"
#include "tests/support/RecordingSession.h"

namespace vesk::test {

class RecordingDaemon : private IPCListenerDelegate {
 public:
  RecordingDaemon(const std::string& socketPath, Record& record, std::size_t maximumConnections = 4096);
  /// Ends all connections.
  ~RecordingDaemon() override;

  /// Sends to the client that connected last.
  void sendToClient(const std::optional<Dictionary>& sessionInfo, double timestamp, std::uint16_t category,
                    std::uint16_t type, const std::optional<Dictionary>& payload);

 private:
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;

  Record& _record;
  std::mutex _mutex;
  std::shared_ptr<IPCConnection> _last;
  IPCListener _listener;
};

}  // namespace vesk::test
