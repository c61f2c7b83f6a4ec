#include "platform/http/PostBudget.h"

#include <utility>

namespace vesk {

namespace {

/// Whether a sum that was full, or was not, is full now. It empties to a half first, so that a sender pauses
/// seldom.
bool isFull(bool wasFull, std::size_t bytes, std::size_t limit) {
  return bytes >= (wasFull ? limit / 2 : limit);
}

}  // namespace

std::shared_ptr<PostAccount> PostBudget::accountFor(std::uint32_t owner, SetPaused setPaused) {
  auto account = std::make_shared<PostAccount>(shared_from_this(), owner, std::move(setPaused));
  MutexLock lock(_mutex);
  _owners[owner].senders.push_back(account.get());
  return account;
}

void PostBudget::change(PostAccount& account, std::size_t added, std::size_t removed) {
  MutexLock lock(_mutex);
  Owner& owner = _owners[account._owner];
  account._bytes += added - removed;
  owner.bytes += added - removed;
  account._isFull = isFull(account._isFull, account._bytes, _limits.ofSender);
  const bool ownerWasFull = owner.isFull;
  owner.isFull = isFull(owner.isFull, owner.bytes, _limits.ofOwner);
  const auto update = [&owner](PostAccount& sender) {
    const bool mustPause = sender._isFull || owner.isFull;
    if (std::exchange(sender._isPaused, mustPause) != mustPause) sender._setPaused(mustPause);
  };
  if (owner.isFull == ownerWasFull) {
    update(account);
  } else {
    for (PostAccount* sender : owner.senders) update(*sender);
  }
}

void PostBudget::close(PostAccount& account) {
  MutexLock lock(_mutex);
  const auto owner = _owners.find(account._owner);
  std::erase(owner->second.senders, &account);
  if (owner->second.senders.empty()) _owners.erase(owner);
}

PostAccount::PostAccount(std::shared_ptr<PostBudget> budget, std::uint32_t owner,
                         PostBudget::SetPaused setPaused)
    : _budget(std::move(budget)), _owner(owner), _setPaused(std::move(setPaused)) {}

PostAccount::~PostAccount() { _budget->close(*this); }

void PostAccount::waitUntilWritten() {
  if (_budget->_keeper && _lastKept != 0) _budget->_keeper->waitUntilWritten(std::exchange(_lastKept, 0));
}

}  // namespace vesk
