#include "backends/VeskReportingBackend.h"

#include "platform/crypto/Digest.h"
#include "platform/log/SystemLog.h"
#include "platform/text/ASCII.h"
#include "util/ReportingdUtil.h"
#include "util/SamplingDraw.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

std::optional<Text> textFrom(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return Text(*text);
}

std::uint8_t versionPiece(std::string_view piece) { return static_cast<std::uint8_t>(leadingInteger(piece)); }

}  // namespace

VeskReportingBackend::VeskReportingBackend(const std::string& name, const Dictionary& profile,
                                           const Text& productFamily, const BackendServices& services)
    : _profile(profile),
      _name(name),
      _productFamily(productFamily),
      _services(services),
      _samplingFactor(nextSamplingDraw()),
      _heldBytes(std::make_shared<HeldAccount>(HeldBudget::Limits().ofSession)) {}

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
  MutexLock lock(_mutex);
  _userInfoDict = userInfo;
}

void VeskReportingBackend::setSessionID(std::uint32_t sessionID) {
  MutexLock lock(_mutex);
  _sessionID = sessionID;
}

void VeskReportingBackend::setCompType(std::int32_t clientType) {
  MutexLock lock(_mutex);
  _compType = clientType;
}

void VeskReportingBackend::setClientVersion(std::uint16_t version) {
  MutexLock lock(_mutex);
  _clientVersion = version;
}

void VeskReportingBackend::setUdid(std::string_view udid) {
  MutexLock lock(_mutex);
  _udid = udid;
}

void VeskReportingBackend::setProductVersion(const std::optional<Text>& version) {
  MutexLock lock(_mutex);
  _productVersion = version;
}

void VeskReportingBackend::setBuildVersion(const std::optional<Text>& version) {
  MutexLock lock(_mutex);
  _buildVersion = version;
}

void VeskReportingBackend::setHardwareType(const std::optional<Text>& type) {
  MutexLock lock(_mutex);
  _hardwareType = type;
}

void VeskReportingBackend::setIsInternal(bool isInternal) {
  MutexLock lock(_mutex);
  _isInternal = isInternal;
}

void VeskReportingBackend::setRequireUserInfo(bool require) {
  MutexLock lock(_mutex);
  _requireUserInfo = require;
}

void VeskReportingBackend::setBatchEvents(bool batch) {
  MutexLock lock(_mutex);
  _batchEvents = batch;
}

void VeskReportingBackend::setSelfVersion(std::string_view version) {
  MutexLock lock(_mutex);
  auto dot = version.find('.');
  _selfVersionMajor = versionPiece(version.substr(0, dot));
  _selfVersionMinor = 0;
  if (dot != std::string_view::npos) {
    auto rest = version.substr(dot + 1);
    _selfVersionMinor = versionPiece(rest.substr(0, rest.find('.')));
  }
}

void VeskReportingBackend::setStartTimestamp(const timeval& timestamp) {
  MutexLock lock(_mutex);
  _startTimeStamp = secondsFromTimeval(timestamp);
}

void VeskReportingBackend::setHeldBytes(HeldBytes heldBytes) {
  MutexLock sending(_sendMutex);
  _heldBytes = std::move(heldBytes);
}

}  // namespace vesk
