// What the operations of a session take and give back.
#pragma once

#include <VeskReporting/values/Export.h>
#include <VeskReporting/values/Value.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace vesk {

/// What became of a call.
enum class [[nodiscard]] ReportingStatus : std::uint8_t{
    Done,             ///< the daemon has answered
    Queued,           ///< waits to be sent, behind everything queued before it
    QueueFull,        ///< not sent: as much waits already as may
    NotConnected,     ///< no daemon was reached in time, or the connection ended before the answer
    TimedOut,         ///< sent, but not answered in time
    Refused,          ///< the daemon answered with an error instead of an answer
    InvalidArgument,  ///< can't be sent: larger than 1 MiB, nested too deeply, text that is not UTF-8
    FileUnavailable,  ///< the file to upload can't be opened or is no regular file
    ForkedProcess,    ///< the session belongs to the process that this one was forked from
    OnSessionThread,  ///< a call that waits, made from a callback, would wait for ever
    Closed,           ///< the session was destroyed before the answer
    OutOfResources,   ///< no memory, no descriptor or no thread
    /// as NotConnected, because the daemon has as many connections as it takes, of this user or in all
    TooManyConnections};

/// A few words for a log line.
VESK_API const char* describe(ReportingStatus status) noexcept;

/// The outcome of a call that is answered.
template <class Answer>
struct [[nodiscard]] ReportingResult {
  ReportingStatus status = ReportingStatus::Done;
  Answer answer{};     ///< the daemon's, when `status` is Done
  std::string detail;  ///< otherwise the cause in words, when there is more to say than `describe` does

  explicit operator bool() const noexcept { return status == ReportingStatus::Done; }
};

/// Called exactly once for each call that was answered with Queued, on the session's thread. It may use the
/// session, except for calls that wait. It must not throw.
template <class Answer>
using ReportingCallback = std::function<void(ReportingResult<Answer> result)>;

using BackendNames = std::vector<std::string>;

/// The names of the enabled backends; nothing when there is no storebag for the client type.
using BackendNamesAnswer = std::optional<BackendNames>;

/// What the backends answered to a message or a flush; nothing when none had anything to say.
using MessageAnswer = std::optional<std::string>;

/// One message of a session that this client aggregates.
struct AggregatedMessage {
  std::optional<Dictionary> sessionInfo;  ///< of the session that sent the message
  double timestamp = 0;                   ///< seconds since 1970
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;

  /// The last message of an aggregation says only that there will be no more.
  bool isClosing() const noexcept { return !sessionInfo && timestamp == 0; }
};

/// Called on the session's thread for each message. It must not throw.
using AggregationHandler = std::function<void(const AggregatedMessage& message)>;

/// How a session behaves; the defaults suit a service that sends now and then.
struct ReportingOptions {
  /// The daemon's socket. Empty: /run/veskreportingd/com.corvane.veskreportingd, under the directory that
  /// VESKREPORTINGD_ROOT names when it is set (and the program is not a setuid one).
  std::string socketPath;
  /// What may wait to be sent, also while the daemon is away; more is dropped.
  std::size_t maximumQueuedMessages = 4096;
  std::size_t maximumQueuedBytes = std::size_t{8} << 20;  ///< roughly, of memory
  /// How long the destructor may take to send what is queued.
  std::chrono::milliseconds drainTime{2'000};
  /// Waits between attempts to reach the daemon: doubled from the first to the last.
  std::chrono::milliseconds firstReconnectWait{50};
  std::chrono::milliseconds lastReconnectWait{5'000};
};

/// What was not sent, by reason; counted since the session was made.
struct ReportingDrops {
  std::uint64_t queueFull = 0;  ///< refused with QueueFull
  std::uint64_t invalid = 0;    ///< could not be encoded
  std::uint64_t unsent = 0;     ///< still queued when their time or the session ended, or no descriptor left

  std::uint64_t total() const noexcept { return queueFull + invalid + unsent; }
};

}  // namespace vesk
