// The outbox's file, and the memory that stands in while the file can't be used.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/outbox/OutboxStore.h"

namespace vesk {

/// Never fails: a full disk or a file that another process uses leaves the posts in memory, and they move to
/// the file when it can be used again. A damaged file is moved to "….damaged", replacing an earlier one; the
/// posts that can still be read move to a new file. Each problem is logged once. For use by one thread at a
/// time; waits for the disk.
class OutboxStorage {
 public:
  using Instant = std::chrono::steady_clock::time_point;
  using Losses = OutboxStore::Losses;

  struct Limits {
    std::uint64_t bytes;
    std::uint64_t bytesInMemory;
  };

  struct Changes {
    std::vector<WaitingPost> added;
    std::vector<std::pair<std::int64_t, WallTime>> postponed;
    std::vector<std::int64_t> removed;

    std::size_t size() const { return added.size() + postponed.size() + removed.size(); }
  };
  /// The posts that were lost, by what became of them.
  struct Lost {
    Losses overQuota;
    Losses damaged;
  };

  /// Opens the file if there is one.
  OutboxStorage(std::string path, Limits limits);

  /// Makes the changes. The oldest posts of the fullest owners give way to new ones.
  void write(Changes& changes, Instant now, Lost& lost);

  /// Lets the next `write` try the file even if it failed a moment ago.
  void tryFileAgain() { _tryFileAgain = {}; }

  /// Up to 64 posts for `host` after `id`, oldest first, that may be sent at `now`.
  std::vector<WaitingPost> read(std::string_view host, std::int64_t id, WallTime now, Lost& lost);

  Losses removeKeptBefore(WallTime time, WallTime now, Lost& lost);
  Losses removeRespectingConsent(Lost& lost);
  /// Gives the file's space back when nothing waits.
  void shrinkIfEmpty(Lost& lost);

  /// The posts that end with the process.
  Losses waitingInMemory() const;

  bool isEmpty() const { return count() == 0; }
  std::uint64_t count() const;
  std::map<std::string, std::uint64_t> countByHost() const;
  std::uint64_t bytes() const { return (_file ? _file->bytes() : 0) + (_memory ? _memory->bytes() : 0); }
  bool has(std::string_view host) const;
  std::int64_t lastID() const { return _file ? _file->lastID() : 0; }

 private:
  bool writeToFile(const Changes& changes, Instant now, Lost& lost);
  static void apply(const Changes& changes, OutboxStore& store, std::uint64_t limit, Losses& overQuota);
  static void add(const WaitingPost& post, OutboxStore& store, std::uint64_t limit, Losses& overQuota);
  void copyMemoryTo(OutboxStore& file, Losses& overQuota) const;
  /// Runs an action on the file, if it is open, and then on the memory.
  std::vector<WaitingPost> postsInMemory() const;
  template <class Action>
  void onEach(Lost& lost, Action action);
  void open();
  void handle(const OutboxStoreError& error, Lost& lost);
  /// Returns the number of events that could be read.
  std::uint64_t replaceDamaged(const char* problem);

  const std::string _path;
  const Limits _limits;
  std::unique_ptr<OutboxStore> _file;    ///< null until it is needed, and while it can't be used
  std::unique_ptr<OutboxStore> _memory;  ///< while the file can't be used
  Instant _tryFileAgain{};
  std::string _problem;  ///< that was logged
};

}  // namespace vesk
