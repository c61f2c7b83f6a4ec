// The file of posts that wait to be sent.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/http/HTTPClient.h"
#include "platform/sqlite/SQLiteHandles.h"
#include "platform/time/Clock.h"

namespace vesk {

struct WaitingPost {
  std::int64_t id = 0;  ///< grows with the order of arrival
  HTTPRequest request;
  WallTime kept{};       ///< when it was put aside
  WallTime notBefore{};  ///< earliest time of the next attempt
};

/// Why the store could not do something. Everything that it was asked for is undone.
class OutboxStoreError : public std::runtime_error {
 public:
  OutboxStoreError(int sqliteCode, const char* text);
  /// The file is damaged, as opposed to full or not accessible.
  bool isDamage() const;
  bool isFull() const;
  /// Another process uses it.
  bool isInUse() const;

 private:
  int _code;
};

/// An SQLite database (WAL), locked for one process, with one row per post and bodies as they are sent. What
/// is removed is overwritten. For use by one thread at a time; waits for the disk. Every operation may throw
/// OutboxStoreError; afterwards only the destructor may be called if it was damage.
class OutboxStore {
 public:
  /// What became of posts that were removed.
  struct Lost {
    std::string source;
    std::uint64_t events;
  };
  using Losses = std::vector<Lost>;

  /// Opens or creates the file with mode 0600, and its directory with mode 0700. Empty: in memory only.
  explicit OutboxStore(const std::string& path);

  /// Calls `take` with each post of a damaged file that can still be read, oldest first. Ignores errors.
  static void salvage(const std::string& path, const std::function<void(const WaitingPost&)>& take);

  // All changes between `begin` and `commit` are made or none. An exception undoes them.
  void begin();
  void commit();
  void rollBack() noexcept;

  void add(const WaitingPost& post);
  void remove(std::int64_t id);
  void postpone(std::int64_t id, WallTime notBefore);
  /// Removes the oldest post of the owner with most bytes, where `owner` counts with `bytes` more. Returns
  /// false if that owner has none.
  bool removeOneOfTheFullest(std::uint32_t owner, std::uint64_t bytes, Losses& lost);
  Losses removeKeptBefore(WallTime time);
  /// Removes the posts that respect consent, without leaving their bytes in the file or its log.
  Losses removeRespectingConsent();
  /// Dates posts that were kept before `time`, while the clock was not set, as kept at `now`.
  void redate(WallTime time, WallTime now);

  /// At most `count` posts for `host` after `id`, oldest first, that may be sent at `now`, and at most one of
  /// more than `bytes` together. Rows that can't be read are removed and added to `damaged`.
  std::vector<WaitingPost> posts(std::string_view host, std::int64_t id, std::size_t count, std::size_t bytes,
                                 WallTime now, Losses& damaged);

  /// Gives the space that is no longer used back to the file system.
  void shrink();

  std::uint64_t bytes() const { return _bytes; }
  std::uint64_t events() const { return _events; }
  const std::map<std::string, std::uint64_t, std::less<>>& countByHost() const { return _countByHost; }
  std::int64_t lastID() const { return _lastID; }

  /// The bytes that a post takes in the store.
  static std::uint64_t sizeOf(const HTTPRequest& request);

 private:
  SQLiteStatement statement(const char* text);
  void execute(const char* text);
  [[noreturn]] void fail();
  void check(int result);
  bool step(sqlite3_stmt* statement);
  Losses removeWhere(const std::string& condition, std::int64_t parameter);
  void readTotals();

  SQLiteDatabase _database;
  // Of the rows. Read again after a failure.
  std::uint64_t _bytes = 0;
  std::uint64_t _events = 0;
  std::map<std::uint32_t, std::uint64_t> _bytesByOwner;
  std::map<std::string, std::uint64_t, std::less<>> _countByHost;
  std::int64_t _lastID = 0;
};

}  // namespace vesk
