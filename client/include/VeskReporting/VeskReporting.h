// The client's side of telemetry reporting.
#pragma once

#include <VeskReporting/VeskReportingKeys.h>
#include <VeskReporting/VeskReportingTypes.h>

#include <memory>

namespace vesk {

/// One session with veskreportingd.
///
/// A session is configured (`setSessionInfo`), started (`startConfig`) and then sends messages, each made of
/// a category, a type and a payload. Operations reach the daemon in the order in which they are called.
/// Connecting, sending and receiving are the work of one thread of the session's own; nothing but the calls
/// that say so waits for anything. When the daemon goes away, the session reaches it again, configures and
/// starts itself as before, and then sends what is queued. A message that the daemon had received but not yet
/// handled when it ended is lost.
///
/// All operations are safe from any thread. None throws. None installs a signal handler. In a process forked
/// from the session's own they are refused with ForkedProcess, and destroying the copy there does nothing.
///
/// Three forms: a call that returns `ReportingStatus` and takes no callback is sent one way; one with a
/// callback returns Queued at once and delivers its result later; one that returns a `ReportingResult` waits
/// at most `timeout`, and a tenth of a second more while a callback holds the session's thread. A timeout
/// counts from the call and covers the time in the queue.
class VESK_API VeskReporting {
 public:
  static constexpr std::chrono::milliseconds kDefaultTimeout{30'000};

  /// Starts the session's thread; the daemon is reached for with the first operation.
  explicit VeskReporting(ReportingOptions options = {}) noexcept;
  /// Waits until the daemon has taken and answered what is queued, at most for `ReportingOptions::drainTime`;
  /// when no daemon was ever there, makes one attempt. Waits for a callback or a handler that runs, however
  /// long it does: not from one, and not under a lock that one wants.
  ~VeskReporting();
  VeskReporting(const VeskReporting&) = delete;
  VeskReporting& operator=(const VeskReporting&) = delete;

  /// Reaches the daemon now and waits for it: Done or NotConnected with the cause. Not needed before other
  /// operations.
  ReportingResult<std::monostate> connect(std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 1. Says who reports, on whose behalf and, with an aggregation handler, that this client wants the
  /// messages of the sessions below its own. Replaces what an earlier call said, unless it can't be sent
  /// (InvalidArgument).
  ReportingStatus setSessionInfo(Dictionary sessionInfo, std::optional<Dictionary> userInfo = std::nullopt,
                                 std::vector<std::string> frameworksToCheck = {},
                                 AggregationHandler aggregationHandler = nullptr) noexcept;

  /// 2. Starts the session: the daemon fetches the storebag of the client type and makes its backends. When
  /// the daemon is not reached in time, it is done once it is.
  ReportingResult<BackendNamesAnswer> startConfig(
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus startConfig(ReportingCallback<BackendNamesAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 3. Gives the session other user info and asks which backends are enabled for it. When the daemon is not
  /// reached in time, the user info is given once it is.
  ReportingResult<BackendNamesAnswer> fetchStates(
      std::optional<Dictionary> userInfo, std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus fetchStates(std::optional<Dictionary> userInfo,
                              ReportingCallback<BackendNamesAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 4. Asks where the session's messages can be looked at; "URL not available" when nowhere.
  ReportingResult<std::string> fetchDisplayURL(std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus fetchDisplayURL(ReportingCallback<std::string> callback,
                                  std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 5. Sends a message.
  ReportingStatus sendMessage(std::uint16_t category, std::uint16_t type,
                              std::optional<Dictionary> payload = std::nullopt) noexcept;
  ReportingStatus sendMessage(std::uint16_t category, std::uint16_t type, std::optional<Dictionary> payload,
                              ReportingCallback<MessageAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<MessageAnswer> sendMessageAndWait(
      std::uint16_t category, std::uint16_t type, std::optional<Dictionary> payload = std::nullopt,
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 6. The same with `kVeskReportingMessageParameters…` keys, which can also carry a flag.
  ReportingStatus sendMessage(Dictionary parameters) noexcept;
  ReportingStatus sendMessage(Dictionary parameters, ReportingCallback<MessageAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<MessageAnswer> sendMessageAndWait(
      Dictionary parameters, std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 7. Has the backends send what they hold back.
  ReportingStatus flushMessages() noexcept;
  ReportingStatus flushMessages(ReportingCallback<MessageAnswer> callback,
                                std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<MessageAnswer> flushMessagesAndWait(
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 8. Uploads a file: it is opened here, by the caller (which takes as long as its file system takes), and
  /// the daemon gets the open descriptor, so it must be readable for the caller only. The answer says whether
  /// a backend took it.
  ReportingResult<bool> uploadFile(const std::string& path,
                                   std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus uploadFile(const std::string& path, ReportingCallback<bool> callback,
                             std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 9. Uploads log data. The answer says whether a backend took it.
  ReportingResult<bool> uploadLogData(List logData,
                                      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus uploadLogData(List logData, ReportingCallback<bool> callback,
                                std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 10. Sends a single message under an identity of its own, for a client that needs no session. The session
  /// info must hold a client type and a session ID; the daemon refuses it otherwise. The answer is "finished"
  /// or "storebag not available".
  ReportingStatus sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload = std::nullopt) noexcept;
  ReportingStatus sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload, ReportingCallback<std::string> callback,
                                  std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<std::string> sendMessageOnceAndWait(
      Dictionary sessionInfo, std::optional<Dictionary> userInfo, std::uint16_t category, std::uint16_t type,
      std::optional<Dictionary> payload = std::nullopt,
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  bool isConnected() const noexcept;
  /// Calls that were not sent.
  std::uint64_t droppedMessages() const noexcept { return drops().total(); }
  ReportingDrops drops() const noexcept;

  /// A stable identifier of this device for events (UUID text): the one that respects the user's diagnostics
  /// consent when `respectsConsent`, else the one that overrides it. Made once and kept in
  /// /var/lib/veskreportingd, which belongs to the daemon: a process that is neither the daemon's user nor
  /// root gets one of its own, stable for its life. Empty only when there is no memory.
  [[nodiscard]] static std::string getPersistentIdentifierForDNU(bool respectsConsent) noexcept;

  /// The version that the installed library declares; "7.0" when it declares none.
  [[nodiscard]] static std::string version() noexcept;

  /// The RSA public key (DER) that storebags are verified with; nothing when none is installed.
  [[nodiscard]] static std::optional<std::string> publicKey() noexcept;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace vesk
