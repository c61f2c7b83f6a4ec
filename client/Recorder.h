// Replaces the daemon in a program's unit tests.
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

/// A directory in TMPDIR that only this user can enter. Removed with its contents.
class PrivateDirectory {
 public:
  /// Throws std::system_error.
  PrivateDirectory();
  ~PrivateDirectory();
  PrivateDirectory(const PrivateDirectory&) = delete;
  PrivateDirectory& operator=(const PrivateDirectory&) = delete;

  const std::string& path() const noexcept { return _path; }

 private:
  std::string _path;
};

/// Records the calls of this process's sessions, and answers them like a daemon whose storebag enables the
/// given backends. Listens on its own socket, so calls take the same path as to a daemon. Thread-safe.
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
  const PrivateDirectory _directory;
  mutable Mutex _mutex;
  std::deque<Kept> _calls VESK_GUARDED_BY(_mutex);
  std::optional<std::vector<std::string>> _backends VESK_GUARDED_BY(_mutex) = {{"httpPost"}};
  IPCListener _listener;
};

}  // namespace vesk
