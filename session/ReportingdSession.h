// The daemon's side of one client connection.
#pragma once

#include <sys/time.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/IPCConnection.h"
#include "platform/sync/Mutex.h"
#include "protocol/ClientSessionInterface.h"
#include "session/BackendSet.h"
#include "session/Dispatch.h"
#include "session/ReportingdSessionDelegate.h"
#include "session/SessionAggregator.h"
#include "session/SessionServices.h"

namespace vesk {

/// Configures the client's backends, passes each message to all of them, and picks the answer.
///
/// The operations of ClientSessionInterface run on the connection's thread. The agent calls the members
/// marked "Family" from other connections' threads, usually while holding its monitor. All fields used by
/// both are guarded by the session's mutex, which is never held during a call of the agent or a backend.
///
/// Shared by the agent's lists, the connection (as exported object) and its handlers. The last owner destroys
/// the session on its own thread; the destructor sends the closing message and flushes and cleans up the
/// backends.
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

  /// Waits until the posts made from the calls so far are on disk, if they are written before they are sent.
  /// Called on the connection's thread.
  void waitForPosts() { _client.posts->waitUntilWritten(); }

  /// Ends the connection; the client may start anew.
  void end() { _connection->invalidate(); }

  // --- Identity
  /// The session's number, chosen by the client; 0 until configured.
  std::uint32_t sessionID() const;
  /// The daemon's identifier of the session: 24 characters, created with it.
  std::string sessionIDString() const;
  std::optional<std::string> storebagVersion() const;
  std::optional<Dictionary> sessionInfo() const;
  std::optional<Dictionary> userInfo() const;
  /// `correlationKeyForUserInfo` of the current user info, cached because every message needs it.
  std::shared_ptr<const std::string> correlationKey() const;
  std::string description() const;
  /// The user of its client process.
  uid_t user() const noexcept { return _client.user; }
  /// For operators: `process`, `user`, `sessionID`, `clientType`, `clientName`, `serviceName`, `level`,
  /// `storebagVersion`, `backends` (by name: `state` and `reason`). Thread-safe.
  Dictionary diagnosis() const;

  // --- Family
  /// The level in the family; 0 is the top.
  std::int32_t getSessionHierarchy() const;
  bool hasAggregator() const noexcept { return _aggregator.isOn(); }
  void updateCombinedSessionID() VESK_EXCLUDES(_mutex);
  void syncReportingStates() VESK_EXCLUDES(_mutex);
  void shutdownSessionAggregation() VESK_EXCLUDES(_mutex);
  /// The names of the enabled backends; nullopt before the first start.
  std::optional<BackendNames> fetchReportingStates() const;
  std::optional<Value> samplingThresholdWithBackendName(const std::string& name) const;

 private:
  using SharedBackends = std::shared_ptr<const BackendSet>;

  // Configuration.
  void createBackendsWithStorebag(const std::optional<Dictionary>& storebag);
  void updateSessionWithDefaultSessionInfo() VESK_EXCLUDES(_mutex);
  void receivedUserInfo(const std::optional<Dictionary>& userInfo) VESK_EXCLUDES(_mutex);
  SharedBackends backends() const;
  std::string displayURLText() const;

  // Dispatch.
  std::optional<std::string> sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                     const std::optional<Dictionary>& payload);
  std::optional<std::string> sendMessageWithDictionary(const Dictionary& parameters);
  void internalSendMessage(const Dictionary& payload, std::uint16_t method, std::uint16_t respCode);
  std::optional<std::string> flushMessages();

  // Family.
  static std::shared_ptr<const std::string> keyFor(const std::optional<Dictionary>& userInfo);
  void aggregateMessage(double timestamp, const MessageParameters& message) VESK_EXCLUDES(_mutex);

  // Constant after construction.
  const std::shared_ptr<ReportingdSessionDelegate> _sessionDelegate;
  const std::shared_ptr<IPCConnection> _connection;
  const SessionServices& _services;
  const std::string _sessionIDString;
  const BackendClient _client;
  Outcomes _outcomes;                // of what no backend took
  std::array<char, 41> _deviceid{};  // NUL-terminated; empty if the device has no ID

  bool _isEnding = false;  // written only by the destructor's thread

  // Synchronised by itself.
  SessionAggregator _aggregator;

  // Guarded by _mutex.
  mutable Mutex _mutex;
  std::uint32_t _sessionID VESK_GUARDED_BY(_mutex) = 0;
  std::optional<Dictionary> _sessionInfo VESK_GUARDED_BY(_mutex);
  std::optional<Dictionary> _userInfo VESK_GUARDED_BY(_mutex);
  std::shared_ptr<const std::string> _correlationKey VESK_GUARDED_BY(_mutex);  // set along with _userInfo
  List _frameworks VESK_GUARDED_BY(_mutex);  // kept for the session's lifetime; not used
  SharedBackends _backends VESK_GUARDED_BY(_mutex);
  std::optional<std::string> _storebagVersion VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
