// One client connection, seen from the daemon.
#pragma once

#include <sys/time.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "backends/BackendServices.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Mutex.h"
#include "protocol/ClientSessionInterface.h"
#include "session/BackendSet.h"
#include "session/ReportingdSessionDelegate.h"

namespace vesk {

/// What all sessions of the process share; outlives them.
struct SessionServices {
  BackendServices& backends;
  std::string libraryVersion;  ///< of the client library, "7.0" when it declares none
};

/// Configures the client's backends, hands each message to all of them, and picks the answer.
///
/// The operations of ClientSessionInterface run on the connection's thread. The agent calls the members
/// marked "relatives" from other connections' threads, most of them with its monitor held; so every field
/// that both touch is guarded by the session's own mutex, which is never held while the agent or a backend is
/// called.
///
/// Shared by the agent's lists, the connection (as exported object) and its handlers; the last of them to let
/// go destroys it on its thread: it then sends the closing message, flushes and cleans up its backends.
class ReportingdSession final : public ClientSessionInterface,
                                public std::enable_shared_from_this<ReportingdSession> {
 public:
  ReportingdSession(std::shared_ptr<ReportingdSessionDelegate> sessionDelegate,
                    std::shared_ptr<IPCConnection> connection, const SessionServices& services);
  ~ReportingdSession() override;
  ReportingdSession(const ReportingdSession&) = delete;
  ReportingdSession& operator=(const ReportingdSession&) = delete;

  // --- ClientSessionInterface
  void setSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                      const List& frameworksToCheck, bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) override;
  void fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                               Reply<std::optional<BackendNames>> completionHandler) override;
  void fetchDisplayURL(Reply<std::string> reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                               const std::optional<Dictionary>& payload,
                               Reply<std::optional<std::string>> reply) override;
  void sendMessageWithDictionary(const Dictionary& parameters,
                                 Reply<std::optional<std::string>> reply) override;
  void flushMessagesWithReply(Reply<std::optional<std::string>> reply) override;
  void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                        Reply<bool> completionHandler) override;
  void uploadLogData(const List& logData, Reply<bool, std::optional<std::string>> completionHandler) override;
  void sendMessageWithSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  const std::optional<Dictionary>& payload,
                                  Reply<std::string> reply) override;

  /// What `sendMessageWithSessionInfo` does with its storebag: sends one message through backends of its own.
  static void sendSingleMessage(const SessionServices& services, uid_t user,
                                const std::optional<Dictionary>& sessionInfo,
                                const std::optional<Dictionary>& userInfo,
                                const std::optional<Dictionary>& storebag, std::uint16_t category,
                                std::uint16_t type, const std::optional<Dictionary>& payload);

  // --- Identity
  /// The client's number for the session; 0 until configured.
  std::uint32_t sessionID() const;
  /// The session's own identity: 24 characters, made at creation.
  std::string sessionIDString() const;
  std::optional<std::string> storebagVersion() const;
  std::optional<Dictionary> sessionInfo() const;
  std::optional<Dictionary> userInfo() const;
  /// `correlationKeyForUserInfo` of the present user info; made when that is set, since messages ask for it.
  std::shared_ptr<const std::string> correlationKey() const;
  std::string description() const;

  // --- Relatives
  /// The level in the family: 0 at the top.
  std::int32_t getSessionHierarchy() const;
  bool hasAggregator() const noexcept { return _hasAggregator.load(); }
  void updateCombinedSessionID() VESK_EXCLUDES(_mutex);
  void syncReportingStates() VESK_EXCLUDES(_mutex);
  void shutdownSessionAggregation() VESK_EXCLUDES(_mutex);
  /// The names of the enabled backends; nothing before the first start.
  std::optional<BackendNames> fetchReportingStates() const;
  std::optional<Value> samplingThresholdWithBackendName(const std::string& name) const;
  /// Hands one message to this session's own client; never waits. One that the client does not take is lost
  /// and counted, and told once a burst: whoever sends it must not pay for a client that does not read.
  void sendToAggregator(const std::optional<Dictionary>& sessionInfo, double timestamp,
                        std::uint16_t category, std::uint16_t type, const std::optional<Dictionary>& payload);

 private:
  using SharedBackends = std::shared_ptr<const BackendSet>;

  // Configuration.
  void createBackendsWithStorebag(const std::optional<Dictionary>& storebag);
  void updateSessionWithDefaultSessionInfo() VESK_EXCLUDES(_mutex);
  void updateReportingStates() VESK_EXCLUDES(_mutex);
  void receivedUserInfo(const std::optional<Dictionary>& userInfo) VESK_EXCLUDES(_mutex);
  static void cleanupBackends(const BackendSet& backends);
  SharedBackends backends() const;
  std::string displayURLText() const;

  // Dispatch.
  std::optional<std::string> sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                     const std::optional<Dictionary>& payload);
  std::optional<std::string> sendMessageWithDictionary(const Dictionary& parameters);
  std::optional<std::string> dispatchMessage(const BackendSet& backends, std::uint16_t category,
                                             std::uint16_t type, const std::optional<Dictionary>& payload,
                                             std::uint32_t flag);
  void internalSendMessage(const Dictionary& payload, std::uint16_t method, std::uint16_t respCode);
  std::optional<std::string> flushMessages();
  static std::optional<std::string> flushBackends(const BackendSet& backends);
  void uploadFileWithURL(const std::string& fileURL, const std::string& extensionToken,
                         Reply<bool> completionHandler);

  // Relatives.
  static std::shared_ptr<const std::string> keyFor(const std::optional<Dictionary>& userInfo);
  bool undeliveredBurstBegins();
  void aggregateMessage(const std::optional<Dictionary>& sessionInfo, double timestamp,
                        std::uint16_t category, std::uint16_t type, const std::optional<Dictionary>& payload)
      VESK_EXCLUDES(_mutex);

  // Constant after construction.
  const std::shared_ptr<ReportingdSessionDelegate> _sessionDelegate;
  const std::shared_ptr<IPCConnection> _connection;
  const SessionServices& _services;
  const std::string _sessionIDString;
  std::array<char, 41> _deviceid{};  // NUL-terminated; empty when the device gives no answer

  bool _isEnding = false;  // by its destructor's thread alone

  // Read for every message of the session, and changed by the session's relatives.
  std::atomic<bool> _hasAggregator{false};

  // Guarded by _mutex.
  mutable Mutex _mutex;
  std::uint32_t _sessionID VESK_GUARDED_BY(_mutex) = 0;
  std::optional<Dictionary> _sessionInfo VESK_GUARDED_BY(_mutex);
  std::optional<Dictionary> _userInfo VESK_GUARDED_BY(_mutex);
  std::shared_ptr<const std::string> _correlationKey VESK_GUARDED_BY(_mutex);  // set along with _userInfo
  List _frameworks VESK_GUARDED_BY(_mutex);  // kept for the session's life and not consulted
  SharedBackends _backends VESK_GUARDED_BY(_mutex);
  std::optional<std::string> _storebagVersion VESK_GUARDED_BY(_mutex);
  WarningBurst _undelivered VESK_GUARDED_BY(_mutex);  // of messages to this session's client
};

}  // namespace vesk
