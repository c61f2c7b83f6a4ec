// Shows operators what becomes of messages, while it happens.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/sync/Mutex.h"

namespace vesk {

/// Passes records from those who deliver to those who look. While nobody looks, asking `isOpen` is all that
/// it costs. Never waits for a reader: one that is slow loses records. Thread-safe; outlives its readers.
class DeliveryTap {
 public:
  using Clock = std::chrono::steady_clock;
  using Filter = std::function<bool(const Dictionary& record)>;

  static constexpr std::size_t kMostReaders = 64;
  static constexpr std::size_t kMostWaiting = 1024;  ///< records for one reader
  /// The bodies that a reader gets in a second, and that may wait for it; records beyond that come without
  /// one.
  static constexpr std::size_t kBodyBytesPerSecond = std::size_t{1} << 20;

  /// What costs more than a reader usually needs.
  struct Wishes {
    bool messages = false;  ///< a record for each message, too, which costs as much as a tenth of the message
    bool bodies = false;    ///< what was sent
  };

  struct Batch {
    std::vector<Value> records;
    std::uint64_t lost = 0;  ///< since the batch before
  };

  class Reader {
   public:
    Reader(DeliveryTap& tap, Filter filter, Wishes wishes)
        : _tap(tap), _filter(std::move(filter)), _wishes(wishes) {}
    ~Reader() { _tap.close(this); }
    Reader(const Reader&) = delete;
    Reader& operator=(const Reader&) = delete;

    /// Returns what came since the last call, at most `kMostInBatch` records, and waits at most `patience`
    /// for the first.
    Batch take(Clock::duration patience);

   private:
    friend class DeliveryTap;
    static constexpr std::size_t kMostInBatch = 256;
    // What comes shortly after the first goes along, so that a busy daemon does not wake the reader for each.
    static constexpr std::chrono::milliseconds kGathering{20};
    static constexpr std::size_t kBodyBytesInBatch = std::size_t{256} << 10;
    struct Waiting {
      Dictionary record;
      std::size_t bodyBytes;
    };
    void add(const Dictionary& record, const std::string& body, Clock::time_point now);
    void waitFor(std::size_t records, Clock::time_point deadline) VESK_REQUIRES(_mutex);
    bool takesBody(std::size_t bytes, Clock::time_point now) VESK_REQUIRES(_mutex);

    DeliveryTap& _tap;
    const Filter _filter;
    const Wishes _wishes;
    Mutex _mutex;  // taken under the tap's
    std::condition_variable_any _added;
    std::deque<Waiting> _waiting VESK_GUARDED_BY(_mutex);
    std::uint64_t _lost VESK_GUARDED_BY(_mutex) = 0;
    Clock::time_point _secondBegan VESK_GUARDED_BY(_mutex){};
    std::size_t _bodyBytes VESK_GUARDED_BY(_mutex) = 0;  ///< in this second
    std::size_t _waitingBodyBytes VESK_GUARDED_BY(_mutex) = 0;
  };

  bool isOpen() const noexcept { return _isOpen.load(std::memory_order_relaxed); }
  /// Whether a reader has that wish.
  bool wantsMessages() const noexcept { return _wantsMessages.load(std::memory_order_relaxed); }
  bool wantsBodies() const noexcept { return _wantsBodies.load(std::memory_order_relaxed); }
  /// `body`: what was sent; becomes the record's `body`, unless it is empty or the reader has had too much.
  void tell(const Dictionary& record, const std::string& body = {}, Clock::time_point now = Clock::now());

  /// `filter` is called under the tap's lock, so it must be quick. Returns null if there are `most` readers.
  std::shared_ptr<Reader> open(Filter filter, Wishes wishes, std::size_t most = kMostReaders);

 private:
  void close(const Reader* reader);
  void update() VESK_REQUIRES(_mutex);

  std::atomic<bool> _isOpen{false};
  std::atomic<bool> _wantsMessages{false};
  std::atomic<bool> _wantsBodies{false};
  Mutex _mutex;
  std::vector<Reader*> _readers VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
