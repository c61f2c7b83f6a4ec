#include "backends/HeldBytes.h"

#include <utility>

namespace vesk {

HeldAccount::HeldAccount(std::size_t limit, std::string holder, std::shared_ptr<HeldAccount> wider)
    : _limit(limit), _holder(std::move(holder)), _wider(std::move(wider)) {}

void HeldAccount::add(std::size_t bytes) noexcept {
  for (HeldAccount* account = this; account; account = account->_wider.get()) account->_bytes += bytes;
}

void HeldAccount::remove(std::size_t bytes) noexcept {
  for (HeldAccount* account = this; account; account = account->_wider.get()) account->_bytes -= bytes;
}

const HeldAccount* HeldAccount::exceeded(std::size_t growth, std::size_t times) const noexcept {
  const HeldAccount* account = this;
  while (account && account->bytes() + growth <= account->limit() * times) account = account->_wider.get();
  return account;
}

HeldBudget::HeldBudget(const Limits& limits)
    : _limits(limits), _all(std::make_shared<HeldAccount>(limits.ofAll, "the daemon")) {}

HeldBytes HeldBudget::accountFor(uid_t user) {
  HeldBytes ofUser;
  {
    MutexLock lock(_mutex);
    std::erase_if(_users, [](const auto& entry) { return entry.second.expired(); });
    auto& known = _users[user];
    ofUser = known.lock();
    if (!ofUser) {
      ofUser = std::make_shared<HeldAccount>(_limits.ofUser, "user " + std::to_string(user), _all);
      known = ofUser;
    }
  }
  return std::make_shared<HeldAccount>(_limits.ofSession, std::string(), std::move(ofUser));
}

}  // namespace vesk
