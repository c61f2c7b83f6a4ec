// Counts what the daemon could not deliver at once, by backend and reason.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <shared_mutex>
#include <string>
#include <string_view>
#include <vector>

namespace vesk {

/// Why messages or events were lost or delayed.
enum class DropReason : std::uint8_t {
  StateDisabled,   ///< the backend is disabled and dropped the message
  TransportError,  ///< the post or upload failed without an answer
  NoURL,           ///< no URL is configured for this kind of post
  ServerError5xx,  ///< the server answered 500 to 599
  OverBound,       ///< dropped by the backend to stay within its limit
  BodyNotBuilt,    ///< the body could not be built
  InvalidMessage,  ///< the message was invalid
  NoBackend,       ///< no backend was there to take the message
  UploadFailed,    ///< a file was not uploaded
  NeverEnabled,    ///< still held when the session ended, because reporting was never enabled
  Unacknowledged,  ///< a datagram was not sent completely or never acknowledged, and was abandoned
  NotAggregated,   ///< the aggregating client did not take its copy: it does not read, or is gone
  NotRecorded,     ///< a local record could not be written
  AdaptorFailed,   ///< an adaptor was missing or did not accept the message
  ServerRefused,   ///< the server answered neither with success (2xx) nor with a server error (5xx)

  Deferred,  ///< not lost: the post could not be delivered and was put aside. One of the following ends it.
  DeliveredLate,     ///< not lost: the server accepted it in the end
  RefusedLate,       ///< the server answered with another status than 2xx
  Expired,           ///< it waited for too long
  OverQuota,         ///< it gave way to others
  ConsentWithdrawn,  ///< the user withdrew consent
  Damaged,           ///< its record could not be read
  NotWritten,        ///< it was not on disk when the daemon ended
  Exported,          ///< not lost: an operator took it away
                     // kDropReasonCount depends on the last reason.
};
inline constexpr std::size_t kDropReasonCount = static_cast<std::size_t>(DropReason::Exported) + 1;

/// False for those that only tell of a delay.
constexpr bool isLoss(DropReason reason) {
  return reason != DropReason::Deferred && reason != DropReason::DeliveredLate &&
         reason != DropReason::Exported;
}

/// A name for tools and logs, such as "state-disabled".
std::string_view nameOfDropReason(DropReason reason) noexcept;

/// Counters that only grow, for the life of the process. Thread-safe. Counting takes a shared lock and one
/// atomic addition; it neither blocks nor throws.
class Counters {
 public:
  struct Count {
    std::string backend;
    DropReason reason;
    std::uint64_t count;
  };

  /// The process's instance.
  static Counters& shared();

  Counters() = default;
  Counters(const Counters&) = delete;
  Counters& operator=(const Counters&) = delete;

  /// Adds `n` messages or events. After 64 different backend names, further names count as "other".
  void count(std::string_view backend, DropReason reason, std::uint64_t n = 1) noexcept;

  /// All counts above zero, ordered by backend name and reason.
  std::vector<Count> snapshot() const;

 private:
  using Row = std::array<std::atomic<std::uint64_t>, kDropReasonCount>;
  Row* rowFor(std::string_view backend);

  mutable std::shared_mutex _mutex;
  std::map<std::string, std::unique_ptr<Row>, std::less<>> _rows;  // guarded by _mutex; rows never move
};

}  // namespace vesk
