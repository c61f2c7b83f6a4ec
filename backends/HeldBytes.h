// Counts the bytes of held events per session, per user and for the process.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <cstddef>
#include <map>
#include <memory>
#include <string>

#include "platform/sync/Mutex.h"

namespace vesk {

/// A sum with a limit. Bytes added to an account also count in the wider accounts, which it keeps alive.
/// Never refuses: the caller checks `exceeded` afterwards and drops something. Thread-safe.
class HeldAccount {
 public:
  /// `holder` names the account's owner in the log; empty for a session's account.
  explicit HeldAccount(std::size_t limit, std::string holder = {},
                       std::shared_ptr<HeldAccount> wider = nullptr);
  HeldAccount(const HeldAccount&) = delete;
  HeldAccount& operator=(const HeldAccount&) = delete;

  void add(std::size_t bytes) noexcept;
  void remove(std::size_t bytes) noexcept;

  std::size_t bytes() const noexcept { return _bytes.load(); }
  std::size_t limit() const noexcept { return _limit; }
  const std::string& holder() const noexcept { return _holder; }
  bool isOfSession() const noexcept { return _holder.empty(); }
  const HeldAccount* wider() const noexcept { return _wider.get(); }

  /// The narrowest account that would exceed `times` its limit if `growth` were added, or null.
  const HeldAccount* exceeded(std::size_t growth = 0, std::size_t times = 1) const noexcept;

 private:
  const std::size_t _limit;
  const std::string _holder;
  const std::shared_ptr<HeldAccount> _wider;
  std::atomic<std::size_t> _bytes{0};
};

using HeldBytes = std::shared_ptr<HeldAccount>;

/// Gives each session its account. Thread-safe.
class HeldBudget {
 public:
  /// In bytes.
  struct Limits {
    std::size_t ofSession = std::size_t{16} << 20;
    std::size_t ofUser = std::size_t{64} << 20;
    std::size_t ofAll = std::size_t{256} << 20;
  };

  HeldBudget() : HeldBudget(Limits{}) {}
  explicit HeldBudget(const Limits& limits);

  /// Makes a new account, for all backends of one session or single message of that user.
  HeldBytes accountFor(uid_t user);

 private:
  const Limits _limits;
  const HeldBytes _all;
  Mutex _mutex;
  std::map<uid_t, std::weak_ptr<HeldAccount>> _users VESK_GUARDED_BY(_mutex);  ///< users with sessions
};

}  // namespace vesk
