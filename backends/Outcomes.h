// What becomes of a backend's messages.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/BackendIdentity.h"
#include "backends/BackendServices.h"
#include "platform/sync/Snapshot.h"
#include "util/Counters.h"
#include "util/DeliveryTap.h"

namespace vesk {

/// Counts what is lost or delayed, and shows all outcomes to operators who look. Thread-safe. `counters`
/// must outlive it.
class Outcomes {
 public:
  Outcomes(std::string backend, const BackendIdentity& identity, Counters& counters,
           std::shared_ptr<DeliveryTap> tap);

  // Of the client, for those who look.
  void setSession(std::uint32_t sessionID, std::int32_t clientType) noexcept;
  void setUserInfo(const std::optional<Dictionary>& userInfo);

  bool isWatched() const noexcept { return _tap->isOpen(); }
  /// Whether what becomes of each message is of interest, and not only what leaves the device or is lost.
  bool watchesMessages() const noexcept { return _tap->wantsMessages(); }
  bool watchesBodies() const noexcept { return _tap->wantsBodies(); }
  /// `what`: "message", "post", "datagram" or "upload". `outcome`: "held", "posted", "sent", "delivered",
  /// "deferred" or "dropped". docs/wire.md has the facts. Expensive; ask `isWatched` first.
  void show(const char* what, const char* outcome, const Dictionary& facts,
            const std::string& body = {}) const;

  /// Counts messages or events and passes them to open taps. Calls `facts` only if a tap is open.
  template <class Facts>
  void count(const char* what, DropReason reason, std::uint64_t n, Facts facts,
             const std::string& body = {}) const {
    _counters.count(_backend, reason, n);
    if (isWatched()) showCounted(what, reason, n, facts(), body);
  }
  void count(const char* what, DropReason reason, std::uint64_t n = 1) const {
    count(what, reason, n, [] { return Dictionary(); });
  }

 private:
  void showCounted(const char* what, DropReason reason, std::uint64_t n, const Dictionary& facts,
                   const std::string& body) const;

  const std::string _backend;
  const std::int64_t _user;
  const std::int64_t _process;
  Counters& _counters;
  const std::shared_ptr<DeliveryTap> _tap;
  std::atomic<std::uint32_t> _sessionID;
  std::atomic<std::int32_t> _clientType;
  Snapshot<std::optional<Value>> _clientName;
};

/// Of what a session could hand to no backend: its name is "session".
inline Outcomes outcomesOfSession(const BackendClient& client, const BackendServices& services) {
  return {"session", BackendIdentity{._client = client}, services.counters, services.tap};
}

}  // namespace vesk
