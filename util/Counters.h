// Counts what the daemon lost, by backend and reason.
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

/// Why messages or events did not get where they should.
enum class DropReason : std::uint8_t {
  StateDisabled,   ///< the backend is disabled: message dropped
  TransportError,  ///< the post or upload failed before any answer
  NoURL,           ///< no URL is configured for this kind of post
  ServerError5xx,  ///< the server answered 500 to 599
  OverBound,       ///< dropped from what the backend held, to stay under its bound
  BodyNotBuilt,    ///< the body could not be built
  InvalidMessage,  ///< the message itself was refused
  NoBackend,       ///< no backend was there to take it
  UploadFailed,    ///< a file was not uploaded
  NeverEnabled,    ///< still held when the session ended, because reporting was not enabled
  Unacknowledged,  ///< a datagram that was not sent whole or never acknowledged, and given up
  NotAggregated,   ///< the aggregating client did not take its copy: it does not read, or has gone
  NotRecorded,     ///< a local record could not be written
  AdaptorFailed,   ///< an adaptor was missing or did not take it
  ServerRefused,   ///< the server answered, neither with success (2xx) nor with an error of its own (5xx)
                   // the last one: kDropReasonCount follows from it
};
inline constexpr std::size_t kDropReasonCount = static_cast<std::size_t>(DropReason::ServerRefused) + 1;

/// A word for it, for tools and logs: "state-disabled".
std::string_view nameOfDropReason(DropReason reason) noexcept;

/// Counters that only grow, for the life of the process. Thread-safe; counting takes a shared lock and one
/// atomic addition, and neither waits for anyone nor throws.
class Counters {
 public:
  struct Count {
    std::string backend;
    DropReason reason;
    std::uint64_t count;
  };

  /// The process's own.
  static Counters& shared();

  Counters() = default;
  Counters(const Counters&) = delete;
  Counters& operator=(const Counters&) = delete;

  /// Adds `n` lost messages or events. Backend names beyond 64 different ones count under "other".
  void count(std::string_view backend, DropReason reason, std::uint64_t n = 1) noexcept;

  /// Everything that is not zero, by backend name and reason.
  std::vector<Count> snapshot() const;

 private:
  using Row = std::array<std::atomic<std::uint64_t>, kDropReasonCount>;
  Row* rowFor(std::string_view backend);

  mutable std::shared_mutex _mutex;
  std::map<std::string, std::unique_ptr<Row>, std::less<>> _rows;  // guarded by _mutex; rows never move
};

}  // namespace vesk
