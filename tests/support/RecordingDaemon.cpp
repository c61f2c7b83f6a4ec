#include "tests/support/RecordingDaemon.h"

#include "protocol/ClientSessionReplyProxy.h"
#include "protocol/ClientSessionStub.h"
#include "protocol/WireNames.h"

namespace vesk::test {

RecordingDaemon::RecordingDaemon(const std::string& socketPath, Record& record,
                                 std::size_t maximumConnections)
    : _record(record), _listener([&] {
        IPCListener::Options options;
        options.socketPath = socketPath;
        options.objectPath = wire::kObjectPath;
        options.maximumConnections = maximumConnections;
        return options;
      }()) {
  _listener.setDelegate(this);
  _listener.resume();
}

RecordingDaemon::~RecordingDaemon() {
  {
    std::lock_guard lock(_mutex);
    _last.reset();
  }
  _listener.stop();
}

bool RecordingDaemon::shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) {
  {
    std::lock_guard lock(_mutex);
    _last = connection;
  }
  connection->resume({std::make_shared<ClientSessionStub>(std::make_shared<RecordingSession>(_record))});
  return true;
}

void RecordingDaemon::sendToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                   std::uint16_t category, std::uint16_t type,
                                   const std::optional<Dictionary>& payload) {
  std::lock_guard lock(_mutex);
  ClientSessionReplyProxy proxy(_last, [this](const std::string& error) { _record.add("error " + error); });
  proxy.sendMessageToClient(sessionInfo, timestamp, category, type, payload);
}

}  // namespace vesk::test
