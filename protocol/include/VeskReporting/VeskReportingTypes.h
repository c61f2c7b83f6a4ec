// Argument and result types of a session's operations.
#pragma once

#include <VeskReporting/values/Value.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iterator>
#include <optional>
#include <string>
#include <vector>

namespace vesk {

/// The outcome of a call.
enum class [[nodiscard]] ReportingStatus : std::uint8_t{
    Done,             ///< the daemon has answered
    Queued,           ///< waits to be sent, after everything queued before it
    QueueFull,        ///< not sent: the queue is full
    NotConnected,     ///< no daemon was reached in time, or the connection ended before the answer
    TimedOut,         ///< sent, but not answered in time
    Refused,          ///< the daemon answered with an error
    InvalidArgument,  ///< can't be sent: larger than 1 MiB, nested too deeply, or text that is not UTF-8
    FileUnavailable,  ///< the file to upload can't be opened or is not a regular file
    ForkedProcess,    ///< the session belongs to the process that this one was forked from
    OnSessionThread,  ///< a blocking call made from a callback would deadlock
    Closed,           ///< the session was destroyed before the answer
    OutOfResources,   ///< out of memory, descriptors or threads
    /// like NotConnected, but the daemon's limit on connections, in total or for this user, is reached
    TooManyConnections};

/// A short description for a log line.
constexpr const char* describe(ReportingStatus status) noexcept {
  // In the order of the enumeration.
  constexpr const char* kTexts[] = {
      "done",
      "queued",
      "too much waits to be sent",
      "no connection to the daemon",
      "no answer in time",
      "refused by the daemon",
      "too large, nested too deeply or no valid text",
      "the file can't be opened",
      "the session belongs to the parent process",
      "a callback must not wait",
      "the session was closed",
      "out of memory, descriptors or threads",
      "too many connections",
  };
  static_assert(std::size(kTexts) == static_cast<std::size_t>(ReportingStatus::TooManyConnections) + 1);
  const auto index = static_cast<std::size_t>(status);
  return index < std::size(kTexts) ? kTexts[index] : "unknown";
}

/// Who reports. With the defaults, the user's consent and the storebag's rules for the client apply; then
/// `clientName` must be set, or nothing is reported.
struct ReportingSession {
  std::int32_t clientType = 0;  ///< selects the storebag
  std::string clientName{};     ///< finds the client's entry in it
  std::string serviceName{};
  std::uint16_t clientVersion = 0;
  std::uint32_t sessionID = 0;  ///< the client's own number for the session
  bool batchEvents = false;     ///< collect events into few posts
  bool requireUserInfo =
      true;  ///< false: report without asking for consent, entry, region, sampling, filters
};

/// The outcome of a call that has an answer.
template <class Answer>
struct [[nodiscard]] ReportingResult {
  ReportingStatus status = ReportingStatus::Done;
  Answer answer{};     ///< the daemon's answer if `status` is Done
  std::string detail;  ///< otherwise the cause, if there is more to say than `describe` does

  explicit operator bool() const noexcept { return status == ReportingStatus::Done; }
};

/// Called exactly once for each call that returned Queued, on the session's thread. May use the session,
/// except for blocking calls. Must not throw.
template <class Answer>
using ReportingCallback = std::function<void(ReportingResult<Answer> result)>;

using BackendNames = std::vector<std::string>;

/// The names of the enabled backends; nullopt if there is no storebag for the client type.
using BackendNamesAnswer = std::optional<BackendNames>;

/// The backends' answer to a message or a flush; nullopt if no backend gave one.
using MessageAnswer = std::optional<std::string>;

/// One message of a session that this client aggregates.
struct AggregatedMessage {
  std::optional<Dictionary> sessionInfo;  ///< of the session that sent the message
  double timestamp = 0;                   ///< seconds since 1970
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;

  /// The closing message of an aggregation; no messages follow it.
  bool isClosing() const noexcept { return !sessionInfo && timestamp == 0; }
};

/// Called on the session's thread for each message. Must not throw.
using AggregationHandler = std::function<void(const AggregatedMessage& message)>;

/// How a session behaves. The defaults suit a service that sends occasionally.
struct ReportingOptions {
  /// The daemon's socket. If empty: /run/veskreportingd/com.corvane.veskreportingd, below the directory named
  /// by the environment variable VESKREPORTINGD_ROOT if it is set and the program is not setuid.
  std::string socketPath;
  /// Limits of the send queue, also while the daemon is unreachable. Further messages are dropped.
  std::size_t maximumQueuedMessages = 4096;
  std::size_t maximumQueuedBytes = std::size_t{8} << 20;  ///< approximate memory
  /// How long the destructor may take to send the queued messages.
  std::chrono::milliseconds drainTime{2'000};
  /// Delay between connection attempts: doubles from the first to the last.
  std::chrono::milliseconds firstReconnectWait{50};
  std::chrono::milliseconds lastReconnectWait{5'000};
  /// How often a started session starts anew, so that a program that runs for long takes up a new storebag or
  /// consent, or reports again after a server's error. 0: never; otherwise at least a second. Each start
  /// sends a session's start event. A start that gave no configuration is repeated in any case, after 15
  /// minutes at the earliest.
  std::chrono::milliseconds refreshInterval{0};
};

/// Messages that were not sent, by reason, since the session was created.
struct ReportingDrops {
  std::uint64_t queueFull = 0;  ///< refused with QueueFull
  std::uint64_t invalid = 0;    ///< could not be encoded
  std::uint64_t unsent = 0;  ///< still queued when their time or the session ended, or no descriptor was left

  std::uint64_t total() const noexcept { return queueFull + invalid + unsent; }
};

}  // namespace vesk
