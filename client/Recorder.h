// Takes the daemon's place in the tests of a program that reports.
#pragma once

#include <VeskReporting/veskreporting.h>

#include <cstddef>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <VeskReporting/values/ValueViews.h>
#include "client/ForkGuard.h"
#include "platform/ipc/IPCListener.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Records what sessions of this process call, and answers as a daemon would whose storebag enables some
/// backends. Listens on a socket of its own, so that calls take the same way as to a daemon. Thread-safe.
class Recorder : private IPCListenerDelegate {
 public:
  /// A call as it was received. Members that it doesn't have are empty.
  struct Call {
    std::int32_t kind = 0;  ///< VESK_RECORDED_…
    std::uint16_t category = 0;
    std::uint16_t type = 0;
    std::int32_t flag = 0;
    std::optional<Dictionary> payload{};
    std::optional<Dictionary> sessionInfo{};
    std::optional<Dictionary> userInfo{};
    std::optional<List> logData{};
    std::string path{};
  };

  /// New sessions connect to it from now on. Throws if it can't listen.
  Recorder();
  /// Ends the connections of its sessions.
  ~Recorder() override;

  /// The socket of the newest recorder of this process; empty if there is none.
  static std::string currentSocket();

  /// Returns false in a process forked from the one that created this, where its thread is gone.
  bool isOurs() const noexcept { return _process.isOurs(); }

  void add(Call call);
  std::size_t count(std::int32_t kind) const;
  /// Null beyond the last. Valid until `clear`.
  const vesk_recorded* at(std::int32_t kind, std::size_t index) const;
  void clear();

  void setBackends(std::optional<std::vector<std::string>> backends);
  std::optional<std::vector<std::string>> backends() const;

 private:
  /// A call with the views that a C caller gets.
  struct Kept {
    explicit Kept(Call received);
    const Call call;
    std::optional<ValueViews> payload, sessionInfo, userInfo, logData;
    vesk_recorded view{};
  };

  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;

  const ForkGuard _process;
  const std::string _directory;
  mutable Mutex _mutex;
  std::deque<Kept> _calls VESK_GUARDED_BY(_mutex);
  std::optional<std::vector<std::string>> _backends VESK_GUARDED_BY(_mutex) = {{"httpPost"}};
  IPCListener _listener;
};

}  // namespace vesk
