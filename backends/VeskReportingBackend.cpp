#include "backends/VeskReportingBackend.h"

#include "platform/crypto/Digest.h"
#include "platform/text/ASCII.h"
#include "util/SamplingDraw.h"

namespace vesk {

namespace {

std::optional<Text> textFrom(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return Text(*text);
}

}  // namespace

VeskReportingBackend::VeskReportingBackend(const std::string& name, const std::optional<Dictionary>& profile,
                                           const BackendIdentity& identity, const BackendServices& services,
                                           std::shared_ptr<Outcomes> outcomes)
    : _profile(profile.value_or(Dictionary())),
      _name(name),
      _identity(identity),
      _services(services),
      _outcomes(outcomes ? std::move(outcomes)
                         : std::make_shared<Outcomes>(name, identity, services.counters, services.tap)),
      _samplingFactor(nextSamplingDraw()) {}

std::string_view nameOfState(std::int32_t state) {
  switch (state) {
    case BackendStatePending:
      return "pending";
    case BackendStateEnabled:
      return "enabled";
    case BackendStateOverride:
      return "override";
    default:
      return "disabled";
  }
}

std::string VeskReportingBackend::convertIntoSHA256(std::string_view text) { return hexLower(sha256(text)); }

void VeskReportingBackend::cleanup() {
  MutexLock sending(_sendMutex);
  cleanupInTurn();
}

void VeskReportingBackend::updateState() {
  MutexLock lock(_mutex);
  updateStateLocked();
}

std::optional<std::string> VeskReportingBackend::sendMessage(const std::optional<Dictionary>& payload,
                                                             const timeval& timestamp, std::uint16_t method,
                                                             std::uint16_t respCode, std::int32_t flag) {
  MutexLock sending(_sendMutex);
  ++_eventID;
  return sendMessageInTurn(payload, timestamp, method, respCode, _eventID, flag);
}

std::optional<std::string> VeskReportingBackend::sendMessageInTurn(const std::optional<Dictionary>&,
                                                                   const timeval&, std::uint16_t,
                                                                   std::uint16_t, std::uint16_t,
                                                                   std::int32_t) {
  return std::nullopt;
}

std::optional<std::string> VeskReportingBackend::flushMessages() {
  MutexLock sending(_sendMutex);
  return flushMessagesInTurn();
}

bool VeskReportingBackend::uploadFileAtPath(const std::string&, const std::string&) { return false; }

bool VeskReportingBackend::uploadLogData(const List&) { return false; }

void VeskReportingBackend::setCorrelatedSessionID(const std::optional<std::string>& sessionID) {
  MutexLock lock(_mutex);
  setCorrelatedSessionIDLocked(textFrom(sessionID));
}

std::optional<std::string> VeskReportingBackend::displayURL() const {
  MutexLock lock(_mutex);
  return _displayURL;
}

std::optional<std::string> VeskReportingBackend::combinedSessionIDString() const {
  MutexLock lock(_mutex);
  if (!_combinedSessionIDString) return std::nullopt;
  return _combinedSessionIDString->string();
}

void VeskReportingBackend::setCombinedSessionIDString(const std::optional<std::string>& sessionID) {
  MutexLock lock(_mutex);
  _combinedSessionIDString = textFrom(sessionID);
}

void VeskReportingBackend::setUserInfoDict(const std::optional<Dictionary>& userInfo) {
  _outcomes->setUserInfo(userInfo);
  MutexLock lock(_mutex);
  _userInfoDict = userInfo;
}

}  // namespace vesk
