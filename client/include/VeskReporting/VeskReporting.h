// The client API for telemetry reporting: inline functions over the C API of veskreporting.h.
#pragma once

#include <VeskReporting/VeskReportingKeys.h>
#include <VeskReporting/VeskReportingTypes.h>
#include <VeskReporting/veskreporting.h>

#include <memory>

namespace vesk {

/// One session with veskreportingd.
///
/// A session is configured (`setSessionInfo`), started (`startConfig`) and then sends messages, each with a
/// category, a type and a payload. Operations reach the daemon in the order of the calls. The session's own
/// thread connects, sends and receives; only the calls documented as waiting block. If the daemon goes away,
/// the session reconnects, repeats its configuration and start, and then sends what is queued. A message that
/// the daemon had received but not yet handled when it ended is lost.
///
/// All operations are thread-safe. None throws or installs a signal handler. In a process forked from the
/// session's own they are refused with ForkedProcess, and destroying the copy there has no effect.
///
/// Operations have three forms: one that returns `ReportingStatus` without a callback is sent one-way; one
/// with a callback returns Queued at once and delivers its result later; one that returns a `ReportingResult`
/// waits up to `timeout`, and a tenth of a second longer while a callback occupies the session's thread. A
/// timeout starts with the call and includes the time in the queue.
class VeskReporting {
 public:
  static constexpr std::chrono::milliseconds kDefaultTimeout{30'000};

  /// Starts the session's thread, which connects to the daemon with the first operation.
  explicit VeskReporting(const ReportingOptions& options = {}) noexcept;
  /// Waits until the daemon has taken and answered what is queued, for at most `ReportingOptions::drainTime`.
  /// If the daemon was never reached, makes one attempt. Waits for a running callback or handler without a
  /// time limit, so it must not be called from one, or while holding a lock that one needs.
  ~VeskReporting() = default;
  VeskReporting(const VeskReporting&) = delete;
  VeskReporting& operator=(const VeskReporting&) = delete;

  /// Connects to the daemon now and waits for the result: Done, or NotConnected with the cause. Not required
  /// before other operations.
  ReportingResult<std::monostate> connect(std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 1. Says who reports, on whose behalf and, with an aggregation handler, that this client wants the
  /// messages of the sessions below its own. Replaces the values of an earlier call, unless it can't be sent
  /// (InvalidArgument).
  ReportingStatus setSessionInfo(Dictionary sessionInfo, std::optional<Dictionary> userInfo = std::nullopt,
                                 std::vector<std::string> frameworksToCheck = {},
                                 AggregationHandler aggregationHandler = nullptr) noexcept;
  /// The same, in short.
  ReportingStatus setSessionInfo(const ReportingSession& session) noexcept;

  /// 2. Starts the session: the daemon fetches the storebag of the client type and creates its backends. If
  /// the daemon is not reached in time, this is done once it is reached.
  ReportingResult<BackendNamesAnswer> startConfig(
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus startConfig(ReportingCallback<BackendNamesAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 3. Replaces the session's user info and asks which backends are enabled for it. If the daemon is not
  /// reached in time, the user info is sent once it is reached.
  ReportingResult<BackendNamesAnswer> fetchStates(
      std::optional<Dictionary> userInfo, std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus fetchStates(std::optional<Dictionary> userInfo,
                              ReportingCallback<BackendNamesAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 4. Asks where the session's messages can be viewed; "URL not available" if nowhere.
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

  /// 6. Sends a message given by `kVeskReportingMessageParameters…` keys, which can also carry a flag.
  ReportingStatus sendMessage(Dictionary parameters) noexcept;
  ReportingStatus sendMessage(Dictionary parameters, ReportingCallback<MessageAnswer> callback,
                              std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<MessageAnswer> sendMessageAndWait(
      Dictionary parameters, std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 7. Makes the backends send what they hold back.
  ReportingStatus flushMessages() noexcept;
  ReportingStatus flushMessages(ReportingCallback<MessageAnswer> callback,
                                std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingResult<MessageAnswer> flushMessagesAndWait(
      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 8. Uploads a file. The file is opened by the calling thread (which takes as long as its file system
  /// takes) and the daemon gets the open descriptor, so only the caller needs read access. The answer says
  /// whether a backend accepted the file.
  ReportingResult<bool> uploadFile(const std::string& path,
                                   std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus uploadFile(const std::string& path, ReportingCallback<bool> callback,
                             std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 9. Uploads log data. The answer says whether a backend accepted it.
  ReportingResult<bool> uploadLogData(List logData,
                                      std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;
  ReportingStatus uploadLogData(List logData, ReportingCallback<bool> callback,
                                std::chrono::milliseconds timeout = kDefaultTimeout) noexcept;

  /// 10. Sends a single message under its own identity, for a client that needs no session. The session info
  /// must contain a client type and a session ID; otherwise the daemon refuses it. The answer is "finished"
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
  /// The number of calls that were not sent.
  std::uint64_t droppedMessages() const noexcept { return drops().total(); }
  ReportingDrops drops() const noexcept;

  /// A stable identifier of this device for events (UUID text): the one that respects the user's diagnostics
  /// consent if `respectsConsent`, otherwise the one that overrides it. Created once and kept in
  /// /var/lib/veskreportingd, which belongs to the daemon. A process that runs as neither the daemon's user
  /// nor root gets its own identifier, stable for its lifetime. Empty only if memory runs out.
  [[nodiscard]] static std::string getPersistentIdentifierForDNU(bool respectsConsent) noexcept;

  /// The version that the installed library declares; "7.0" if it declares none.
  [[nodiscard]] static std::string version() noexcept;

  /// The RSA public key (DER) that verifies storebags; nullopt if none is installed.
  [[nodiscard]] static std::optional<std::string> publicKey() noexcept;

 private:
  struct Freed {
    void operator()(vesk_session* session) const noexcept { vesk_session_free(session); }
  };
  const std::unique_ptr<vesk_session, Freed> _session;  ///< null if it could not be made
};

}  // namespace vesk

#include <VeskReporting/VeskReporting-inl.h>
