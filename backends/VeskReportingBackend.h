// The interface of reporting backends to their sessions.
#pragma once

#include <sys/time.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/BackendIdentity.h"
#include "backends/BackendServices.h"
#include "backends/Outcomes.h"
#include "platform/sync/Mutex.h"
#include "platform/sync/Snapshot.h"

namespace vesk {

enum BackendState : std::int32_t {
  BackendStatePending = 0,   ///< not yet decided; messages are held back
  BackendStateDisabled = 1,  ///< reporting off; messages are dropped
  BackendStateEnabled = 2,   ///< reporting on
  BackendStateOverride = 3,  ///< sampled out, inside the override band: held back until a message lifts it
};

/// A message's flag: one of these, or both. With any other value it is an ordinary message.
/// "pending", "enabled", "disabled" or "override".
std::string_view nameOfState(std::int32_t state);

enum MessageFlag : std::int32_t {
  MessageFlagRealtime = 1,
  MessageFlagOverrideSampling = 2,
};
constexpr std::int32_t kMessageFlagBoth = MessageFlagRealtime | MessageFlagOverrideSampling;
constexpr bool isRealtime(std::int32_t flag) {
  return flag == MessageFlagRealtime || flag == kMessageFlagBoth;
}
constexpr bool isOverridingSampling(std::int32_t flag) {
  return flag == MessageFlagOverrideSampling || flag == kMessageFlagBoth;
}

/// One destination of a session's messages. Its operations may be called from any thread.
///
/// The operations that send (sendMessage, flushMessages, cleanup) do not overlap: each holds _sendMutex from
/// its first access to the backend until its post or datagram is on its way, however long the body takes to
/// build. So messages are sent, logged and answered in the order of their numbers, and cleanup waits for a
/// body that is being built. They must not be called under the agent's monitor. Subclasses override the
/// `…InTurn` forms.
///
/// All other operations, which relatives call under the monitor, take only _mutex. It is a leaf and held
/// briefly: never while a body is built or compressed, while foreign code runs or while waiting for a server.
/// Subclasses override the `…Locked` forms.
///
/// Kept alive by its session and by posts in progress.
class VeskReportingBackend : public std::enable_shared_from_this<VeskReportingBackend> {
 public:
  virtual ~VeskReportingBackend() = default;
  VeskReportingBackend(const VeskReportingBackend&) = delete;
  VeskReportingBackend& operator=(const VeskReportingBackend&) = delete;

  /// Lower-case hexadecimal SHA-256 of the text's bytes, 64 characters.
  static std::string convertIntoSHA256(std::string_view text);

  // --- What a session asks of every backend ---------------------------------------------------------------

  /// Ends the backend's activity when its session ends or replaces it. Has no effect the second time.
  void cleanup() VESK_EXCLUDES(_sendMutex, _mutex);

  /// Re-evaluates the state.
  void updateState() VESK_EXCLUDES(_mutex);

  /// Numbers the message with the backend's next event ID (1 after construction, 0 after 65535) and sends it.
  /// Returns the text for the local message log, if any.
  std::optional<std::string> sendMessage(const std::optional<Dictionary>& payload, const timeval& timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::int32_t flag)
      VESK_EXCLUDES(_sendMutex, _mutex);

  /// Sends what is held back, if allowed. Returns the text for the local message log, if any.
  std::optional<std::string> flushMessages() VESK_EXCLUDES(_sendMutex, _mutex);

  /// `extensionToken` names the descriptor that the client passed. May block for a server's answer.
  virtual bool uploadFileAtPath(const std::string& path, const std::string& extensionToken);
  /// May block for a server's answer.
  virtual bool uploadLogData(const List& logData);

  void setCorrelatedSessionID(const std::optional<std::string>& sessionID);

  // --- Properties -----------------------------------------------------------------------------------------

  /// Also written by the completion of a post.
  std::int32_t state() const noexcept { return _state.load(); }
  void setState(std::int32_t state) noexcept { _state.store(state); }
  /// Why it doesn't send, for operators; nullopt if it does or if there is nothing to say.
  virtual std::optional<std::string> stateReason() const { return std::nullopt; }
  /// This backend's sampling draw, uniform in [0, 1).
  double samplingFactor() const noexcept { return _samplingFactor.load(); }
  void setSamplingFactor(double factor) noexcept { _samplingFactor.store(factor); }

  const std::string& name() const noexcept { return _name; }
  std::int32_t hierarchy() const noexcept { return _hierarchy.load(); }
  void setHierarchy(std::int32_t hierarchy) noexcept { _hierarchy.store(hierarchy); }

  /// A number.
  std::optional<Value> samplingThreshold() const { return _samplingThreshold.load(); }
  void setSamplingThreshold(const std::optional<Value>& threshold) { _samplingThreshold.store(threshold); }
  std::optional<std::string> displayURL() const;
  std::optional<std::string> combinedSessionIDString() const;
  void setCombinedSessionIDString(const std::optional<std::string>& sessionID);
  void setUserInfoDict(const std::optional<Dictionary>& userInfo);

 protected:
  VeskReportingBackend(const std::string& name, const std::optional<Dictionary>& profile,
                       const BackendIdentity& identity, const BackendServices& services,
                       std::shared_ptr<Outcomes> outcomes = nullptr);

  virtual std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                                       const timeval& timestamp, std::uint16_t method,
                                                       std::uint16_t respCode, std::uint16_t eventID,
                                                       std::int32_t flag) VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
  virtual std::optional<std::string> flushMessagesInTurn() VESK_REQUIRES(_sendMutex) VESK_EXCLUDES(_mutex) {
    return std::nullopt;
  }
  virtual void cleanupInTurn() VESK_REQUIRES(_sendMutex) VESK_EXCLUDES(_mutex) {}
  virtual void updateStateLocked() VESK_REQUIRES(_mutex) { setState(BackendStateEnabled); }
  virtual void setCorrelatedSessionIDLocked(const std::optional<Text>& sessionID) VESK_REQUIRES(_mutex) {
    _combinedSessionIDString = sessionID;
  }

  // Constant after construction.
  const Dictionary _profile;
  const std::string _name;
  const BackendIdentity _identity;
  const BackendServices& _services;
  const std::shared_ptr<Outcomes> _outcomes;  // also of datagrams that outlive the backend

  // Thread-safe by themselves.
  std::atomic<std::int32_t> _state{BackendStatePending};
  std::atomic<std::int32_t> _hierarchy{0};
  std::atomic<double> _samplingFactor;
  Snapshot<std::optional<Value>> _samplingThreshold;  // a number

  // Guarded by _sendMutex.
  Mutex _sendMutex;
  std::uint16_t _eventID VESK_GUARDED_BY(_sendMutex) = 0;

  // Guarded by _mutex.
  mutable Mutex _mutex VESK_ACQUIRED_AFTER(_sendMutex);
  std::optional<Text> _combinedSessionIDString VESK_GUARDED_BY(_mutex);
  std::optional<Dictionary> _userInfoDict VESK_GUARDED_BY(_mutex);
  std::optional<std::string> _displayURL VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
