// Remembers what came recently, in bounded memory.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <unordered_map>

namespace vesk {

/// A record for each of the last `limit` keys, which are hashes. Not thread-safe.
template <class Record>
class RecentRecords {
 public:
  explicit RecentRecords(std::size_t limit) : _limit(limit) {}

  /// The key's record. A new key gets one; beyond the limit it takes the place of the oldest.
  Record& at(std::uint64_t key) {
    auto [entry, isNew] = _records.try_emplace(key);
    if (!isNew) return entry->second;
    _order.push_back(key);
    if (_order.size() > _limit) {
      _records.erase(_order.front());
      _order.pop_front();
    }
    return entry->second;
  }

 private:
  const std::size_t _limit;
  std::deque<std::uint64_t> _order;  // oldest first
  std::unordered_map<std::uint64_t, Record> _records;
};

}  // namespace vesk
