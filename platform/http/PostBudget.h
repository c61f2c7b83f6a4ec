// Limits the posts that wait although their server answers.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <vector>

#include "platform/http/PostKeeper.h"
#include "platform/sync/Mutex.h"

namespace vesk {

class PostAccount;

/// Tells senders to pause while too many of their posts wait for servers that answer. What waits during an
/// outage doesn't count, since pausing would not help. Thread-safe.
class PostBudget : public std::enable_shared_from_this<PostBudget> {
 public:
  /// In bytes of memory. A sender that reached its limit may continue once half of it is free.
  struct Limits {
    std::size_t ofSender = std::size_t{4} << 20;
    std::size_t ofOwner = std::size_t{8} << 20;  ///< for all senders of an owner
  };
  /// Called with true when the sender must pause and with false when it may continue, on any thread, with the
  /// budget's lock held. Must neither block nor throw.
  using SetPaused = std::function<void(bool isPaused)>;

  PostBudget() : PostBudget(Limits{}) {}
  /// `keeper`: of the client, if posts are written before they are sent. Must outlive all accounts.
  explicit PostBudget(const Limits& limits, PostKeeper* keeper = nullptr)
      : _limits(limits), _keeper(keeper) {}

  /// Makes an account for a new sender. `owner`: see HTTPRequest::owner.
  std::shared_ptr<PostAccount> accountFor(std::uint32_t owner, SetPaused setPaused);

 private:
  friend class PostAccount;
  struct Owner {
    std::size_t bytes = 0;
    bool isFull = false;
    std::vector<PostAccount*> senders;
  };
  void change(PostAccount& account, std::size_t added, std::size_t removed);
  void close(PostAccount& account);

  const Limits _limits;
  PostKeeper* const _keeper;
  Mutex _mutex;  // a leaf, but for what `SetPaused` takes
  std::map<std::uint32_t, Owner> _owners VESK_GUARDED_BY(_mutex);
};

/// One sender's waiting posts. Shared by the sender and its posts. Thread-safe.
class PostAccount {
 public:
  PostAccount(std::shared_ptr<PostBudget> budget, std::uint32_t owner, PostBudget::SetPaused setPaused);
  ~PostAccount();
  PostAccount(const PostAccount&) = delete;
  PostAccount& operator=(const PostAccount&) = delete;

  void add(std::size_t bytes) { _budget->change(*this, bytes, 0); }
  void remove(std::size_t bytes) { _budget->change(*this, 0, bytes); }

  /// Notes the keeper's ticket of the sender's latest post; 0 if it was not kept. Called on the sender's
  /// thread.
  void noteKept(PostKeeper::Ticket ticket) { _lastKept = std::max(_lastKept, ticket); }
  /// Waits until the posts that the sender's thread has made are on disk, if they are written before they are
  /// sent. Called on that thread.
  void waitUntilWritten();

 private:
  friend class PostBudget;

  const std::shared_ptr<PostBudget> _budget;
  const std::uint32_t _owner;
  const PostBudget::SetPaused _setPaused;
  PostKeeper::Ticket _lastKept = 0;
  // Guarded by the budget's mutex.
  std::size_t _bytes = 0;
  bool _isFull = false;
  bool _isPaused = false;
};

}  // namespace vesk
