// The daemon's end of the protocol, on real sockets, with sessions that only keep a record.
#pragma once

#include <atomic>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "client/protocol/ClientSessionInterface.h"
#include "platform/ipc/IPCListener.h"

namespace vesk::test {

/// What the sessions of one daemon were told, and what they answer. Outlives the daemon, as a test may start
/// another one on the same socket. For any thread.
class Record {
 public:
  /// Answers are kept back until `release`.
  std::atomic<bool> holdsAnswers{false};
  /// Answers are never given: their callers get an error.
  std::atomic<bool> abandonsAnswers{false};

  /// What startConfig and fetchStates answer.
  void setBackends(std::optional<BackendNames> names);
  std::optional<BackendNames> backends() const;

  void add(std::string line);
  void hold(std::function<void()> answer);
  void release();

  std::vector<std::string> lines() const;
  std::size_t count(std::string_view beginning) const;
  /// False when there are not that many within a minute.
  bool waitForCount(std::string_view beginning, std::size_t number) const;
  bool waitForLine(std::string_view beginning) const { return waitForCount(beginning, 1); }

 private:
  std::size_t countLocked(std::string_view beginning) const;

  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::optional<BackendNames> _backends = BackendNames{"httpPost", "wren"};
  std::vector<std::string> _lines;
  std::vector<std::function<void()>> _held;
};

class RecordingDaemon : private IPCListenerDelegate {
 public:
  RecordingDaemon(const std::string& socketPath, Record& record);
  /// Ends all connections.
  ~RecordingDaemon() override;

  /// To the client that connected last.
  void sendToClient(const std::optional<Dictionary>& sessionInfo, double timestamp, std::uint16_t category,
                    std::uint16_t type, const std::optional<Dictionary>& payload);
  std::size_t connections() const { return _listener.connectionCount(); }

 private:
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;

  Record& _record;
  std::mutex _mutex;
  std::shared_ptr<IPCConnection> _last;
  IPCListener _listener;
};

}  // namespace vesk::test
