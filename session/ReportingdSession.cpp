#include "session/ReportingdSession.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>

#include "platform/crypto/Base64.h"
#include "platform/crypto/UUID.h"
#include "platform/log/SystemLog.h"
#include "session/ReportingStates.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

std::string freshIdentity() {
  UUIDBytes uuid = makeUUID();
  return base64Encode({reinterpret_cast<const char*>(uuid.data()), uuid.size()});
}

std::uint32_t sessionIDIn(const Dictionary& sessionInfo) {
  return static_cast<std::uint32_t>(
      integerForKey(sessionInfo, kVeskReportingSessionInfoSessionID).value_or(0));
}

std::int32_t clientTypeIn(const Dictionary& sessionInfo) {
  return static_cast<std::int32_t>(
      integerForKey(sessionInfo, kVeskReportingSessionInfoClientType).value_or(0));
}

bool requiresUserInfo(const Dictionary& sessionInfo) {
  return booleanForKey(sessionInfo, kVeskReportingSessionInfoRequireUserInfo).value_or(false);
}

// The account keeps the connection until the last of its posts is done.
BackendClient clientOf(const std::shared_ptr<IPCConnection>& connection, PostBudget& budget) {
  const IPCPeer peer = connection->peer();
  return {peer.user, peer.process,
          budget.accountFor(peer.user, [connection](bool isPaused) { connection->setPaused(isPaused); })};
}

// Whether both have the same text under `key`.
bool sameText(const std::optional<Dictionary>& a, const std::optional<Dictionary>& b, const char* key) {
  auto first = a ? a->text(key) : std::nullopt;
  auto second = b ? b->text(key) : std::nullopt;
  return first && second && *first == *second;
}

}  // namespace

ReportingdSession::ReportingdSession(std::shared_ptr<ReportingdSessionDelegate> sessionDelegate,
                                     std::shared_ptr<IPCConnection> connection,
                                     const SessionServices& services)
    : _sessionDelegate(std::move(sessionDelegate)),
      _connection(std::move(connection)),
      _services(services),
      _sessionIDString(freshIdentity()),
      _client(clientOf(_connection, *services.backends.postBudget)),
      _outcomes(outcomesOfSession(_client, services.backends)),
      _aggregator(_connection, services.backends.counters),
      _correlationKey(keyFor(std::nullopt)) {
  VESK_LOG_DEBUG("initWithSessionDelegate: ReportingdSession initWithSessionDelegate:%s",
                 _sessionDelegate->description().c_str());
  copyUniqueDeviceID(_deviceid.data(), _deviceid.size());
  VESK_LOG_DEBUG("initWithSessionDelegate: Initialized session with UUID %s", _sessionIDString.c_str());
}

ReportingdSession::~ReportingdSession() {
  VESK_LOG_DEBUG("dealloc: ReportingdSession dealloc: %u", sessionID());
  _isEnding = true;
  _aggregator.end();
  // If one step runs out of memory, the process goes on and the other steps are still tried.
  auto attempt = [](auto step) {
    try {
      step();
    } catch (const std::exception& error) {
      VESK_LOG_ERROR("dealloc: ReportingdSession: %s", error.what());
    }
  };
  attempt([this] {
    MutableDictionary payload;
    if (auto version = storebagVersion()) payload.set("StorebagVersion", *version);
    internalSendMessage(payload.share(), 0, 1);
  });
  attempt([this] { flushMessages(); });
  attempt([this] { shutdownSessionAggregation(); });
  attempt([this] {
    if (auto set = backends()) cleanupBackends(*set);
  });
}

// --- Identity

std::uint32_t ReportingdSession::sessionID() const {
  MutexLock lock(_mutex);
  return _sessionID;
}

std::string ReportingdSession::sessionIDString() const { return _sessionIDString; }

std::optional<std::string> ReportingdSession::storebagVersion() const {
  MutexLock lock(_mutex);
  return _storebagVersion;
}

std::optional<Dictionary> ReportingdSession::sessionInfo() const {
  MutexLock lock(_mutex);
  return _sessionInfo;
}

std::optional<Dictionary> ReportingdSession::userInfo() const {
  MutexLock lock(_mutex);
  return _userInfo;
}

std::string ReportingdSession::description() const {
  char text[96];
  std::snprintf(text, sizeof text, "<ReportingdSession %u %s>", sessionID(), _sessionIDString.c_str());
  return text;
}

std::shared_ptr<const std::string> ReportingdSession::correlationKey() const {
  MutexLock lock(_mutex);
  return _correlationKey;
}

ReportingdSession::SharedBackends ReportingdSession::backends() const {
  MutexLock lock(_mutex);
  return _backends;
}

// --- The client's operations

void ReportingdSession::setSessionInfo(const Dictionary& sessionInfo,
                                       const std::optional<Dictionary>& userInfo,
                                       const List& frameworksToCheck, bool hasAggregationBlock) {
  std::uint32_t newID = sessionIDIn(sessionInfo);
  {
    MutexLock lock(_mutex);
    _sessionID = newID;
  }
  VESK_LOG_DEBUG("setSessionInfo: Configuring session %u", newID);
  if (userInfo && !requiresUserInfo(sessionInfo)) {
    VESK_LOG_WARNING("setSessionInfo: Configure session: user info provided without requiring it");
  }
  auto key = keyFor(userInfo);
  _outcomes.setSession(newID, clientTypeIn(sessionInfo));
  _outcomes.setUserInfo(userInfo);
  MutexLock lock(_mutex);
  _sessionInfo = sessionInfo;
  _frameworks = frameworksToCheck;
  _userInfo = userInfo;
  _correlationKey = std::move(key);
  _aggregator.setOn(hasAggregationBlock);
}

void ReportingdSession::startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) {
  VESK_LOG_DEBUG("startConfigWithCompletionHandler: Starting configuration for session %u", sessionID());
  auto storebag = _sessionDelegate->storebagForSession(*this);
  if (!storebag) {
    reply(std::nullopt);
    return;
  }
  auto version = _sessionDelegate->storebagVersionForSession(*this);
  {
    MutexLock lock(_mutex);
    _storebagVersion = std::move(version);
  }
  createBackendsWithStorebag(storebag);
  updateSessionWithDefaultSessionInfo();
  reply(fetchReportingStates());
}

void ReportingdSession::fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                                                Reply<std::optional<BackendNames>> completionHandler) {
  VESK_LOG_DEBUG("fetchStatesWithUserInfo: Fetching states for session %u", sessionID());
  receivedUserInfo(userInfo);
  completionHandler(fetchReportingStates());
}

void ReportingdSession::fetchDisplayURL(Reply<std::string> reply) {
  VESK_LOG_DEBUG("fetchDisplayURL: Fetching display URL for session %u", sessionID());
  reply(displayURLText());
}

std::string ReportingdSession::displayURLText() const {
  auto set = backends();
  std::optional<std::string> url;
  for (const char* name :
       {kVeskReportingBackendHTTPPost, kVeskReportingBackendHTTPPost2, kVeskReportingBackendDashboard}) {
    auto backend = set ? findBackend(*set, name) : nullptr;
    if (backend) url = backend->displayURL();
    if (url)
      return *url + "?sequences=" + std::to_string(static_cast<std::int32_t>(sessionID())) + "&override=yes";
  }
  return "URL not available";
}

void ReportingdSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                const std::optional<Dictionary>& payload,
                                                Reply<std::optional<std::string>> reply) {
  VESK_LOG_DEBUG("sendMessageWithCategory: Sending message for session %u", sessionID());
  reply(fittingAnswer(sendMessageWithCategory(category, type, payload)));
}

void ReportingdSession::sendMessageWithDictionary(const Dictionary& parameters,
                                                  Reply<std::optional<std::string>> reply) {
  VESK_LOG_DEBUG("sendMessageWithCategory: Sending message for session %u", sessionID());
  reply(fittingAnswer(sendMessageWithDictionary(parameters)));
}

void ReportingdSession::flushMessagesWithReply(Reply<std::optional<std::string>> reply) {
  VESK_LOG_DEBUG("flushMessagesWithReply: Flushing messages for session %u", sessionID());
  reply(fittingAnswer(flushMessages()));
}

void ReportingdSession::uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                                         Reply<bool> completionHandler) {
  VESK_LOG_DEBUG("uploadFileAtPath: Uploading file for session %u", sessionID());
  completionHandler(uploadFileWithURL(backends().get(), fileURL, extensionToken, _outcomes));
}

void ReportingdSession::uploadLogData(const List& logData,
                                      Reply<bool, std::optional<std::string>> completionHandler) {
  completionHandler(vesk::uploadLogData(backends().get(), logData, _outcomes), std::nullopt);
}

void ReportingdSession::sendMessageWithSessionInfo(const Dictionary& sessionInfo,
                                                   const std::optional<Dictionary>& userInfo,
                                                   std::uint16_t category, std::uint16_t type,
                                                   const std::optional<Dictionary>& payload,
                                                   Reply<std::string> reply) {
  if (!integerForKey(sessionInfo, kVeskReportingSessionInfoClientType) ||
      !integerForKey(sessionInfo, kVeskReportingSessionInfoSessionID)) {
    VESK_LOG_ERROR("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    _outcomes.count("message", DropReason::InvalidMessage);
    return;  // destroying the reply uncalled sends an error
  }
  {
    MutexLock lock(_mutex);
    _sessionID = sessionIDIn(sessionInfo);
    _sessionInfo = sessionInfo;
  }
  _outcomes.setSession(sessionIDIn(sessionInfo), clientTypeIn(sessionInfo));
  receivedUserInfo(userInfo);
  VESK_LOG_DEBUG("sendMessageWithSessionInfo: Sending message with session info for session %u", sessionID());
  auto storebag = _sessionDelegate->storebagForSession(*this);
  if (!storebag) {
    _outcomes.count("message", DropReason::NoBackend);
    reply("storebag not available");
    return;
  }
  vesk::sendMessageWithSessionInfo(_services, _client, sessionInfo, userInfo, storebag, category, type,
                                   payload);
  reply("finished");
}

// --- Messages

std::optional<std::string> ReportingdSession::sendMessageWithCategory(
    std::uint16_t category, std::uint16_t type, const std::optional<Dictionary>& payload) {
  MutableDictionary parameters;
  parameters.reserve(4);
  parameters.append(Text::literal(kVeskReportingMessageParametersCategory), static_cast<unsigned>(category));
  parameters.append(Text::literal(kVeskReportingMessageParametersType), static_cast<unsigned>(type));
  if (payload) parameters.append(Text::literal(kVeskReportingMessageParametersPayload), *payload);
  parameters.append(Text::literal(kVeskReportingMessageParametersFlag), 0);
  return sendMessageWithDictionary(parameters.share());
}

std::optional<std::string> ReportingdSession::sendMessageWithDictionary(const Dictionary& parameters) {
  auto set = backends();
  if (!set) {
    VESK_LOG_DEBUG("sendMessageWithDictionary: No backends available to send message");
    // The session's own closing message is not counted if it never had a backend.
    if (!_isEnding) _outcomes.count("message", DropReason::NoBackend);
    return std::nullopt;
  }
  const auto message = messageFrom(parameters);
  if (!message) {
    _outcomes.count("message", DropReason::InvalidMessage);
    return std::nullopt;
  }
  if (set->empty() && !_isEnding) _outcomes.count("message", DropReason::NoBackend);
  const timeval now = timevalFrom(_services.backends.clock.now());
  aggregateMessage(secondsFromTimeval(now), *message);
  return dispatchMessage(*set, *message, now);
}

void ReportingdSession::aggregateMessage(double timestamp, const MessageParameters& message) {
  const auto info = sessionInfo();
  // A message at the top of its family must not wait for the monitor, which is held during storebag fetches.
  if (_sessionDelegate->mayHaveAncestor(*this)) {
    // Declared outside the lock's scope: if this is the session's last reference, the lock is released first.
    std::shared_ptr<ReportingdSession> ancestor;
    RecursiveMutexLock monitor(_sessionDelegate->monitor());
    ancestor = _sessionDelegate->getAncestorWithAggregatorForSession(*this);
    if (ancestor) {
      ancestor->_aggregator.sendToAggregator(info, timestamp, message.category, message.type,
                                             message.payload);
      return;
    }
  }
  if (hasAggregator()) {
    _aggregator.sendToAggregator(info, timestamp, message.category, message.type, message.payload);
  }
}

void ReportingdSession::internalSendMessage(const Dictionary& payload, std::uint16_t method,
                                            std::uint16_t respCode) {
  sendMessageWithCategory(method, respCode, payload);
  VESK_LOG_DEBUG("internalSendMessage: Sent internal message (method:%d respCode:%d)", method, respCode);
}

std::optional<std::string> ReportingdSession::flushMessages() {
  auto set = backends();
  if (!set) {
    VESK_LOG_DEBUG("flushMessages: No backends available to send message");
    return std::nullopt;
  }
  return flushBackends(*set);
}

// --- Configuration

void ReportingdSession::createBackendsWithStorebag(const std::optional<Dictionary>& storebag) {
  VESK_LOG_DEBUG("createBackendsWithStorebag: Creating backends for session %u", sessionID());
  auto created = createBackends(storebag, sessionInfo(), userInfo(), _deviceid.data(),
                                _services.libraryVersion, _client, _services.backends);
  SharedBackends next;
  if (created) {
    for (const auto& [name, backend] : *created) backend->setCombinedSessionIDString(_sessionIDString);
    next = std::make_shared<const BackendSet>(std::move(*created));
  }
  SharedBackends previous;
  {
    MutexLock lock(_mutex);
    previous = std::exchange(_backends, std::move(next));
  }
  // Started a second time: the previous backends send what they hold if allowed, then end.
  if (previous) {
    flushBackends(*previous);
    cleanupBackends(*previous);
  }
  internalSendMessage(deviceDictionary(_services.libraryVersion, _services.backends.regionCode()), 0, 0);
}

void ReportingdSession::updateSessionWithDefaultSessionInfo() {
  // The level is only final once the states are decided. No other session may find this one in its family
  // before that.
  RecursiveMutexLock monitor(_sessionDelegate->monitor());
  _sessionDelegate->userInfoUpdatedForSession(*this);
  if (auto set = backends()) updateReportingStates(*set, userInfo());
  _sessionDelegate->updateDownstreamSessions(*this);
}

std::shared_ptr<const std::string> ReportingdSession::keyFor(const std::optional<Dictionary>& userInfo) {
  return std::make_shared<const std::string>(correlationKeyForUserInfo(userInfo.value_or(Dictionary())));
}

void ReportingdSession::receivedUserInfo(const std::optional<Dictionary>& userInfo) {
  auto stored = this->userInfo();
  if (stored) {
    if (sameText(userInfo, stored, kVeskReportingUserInfoClientName) &&
        sameText(userInfo, stored, kVeskReportingUserInfoServiceName)) {
      return;
    }
  } else if (!userInfo) {
    return;
  }
  VESK_LOG_DEBUG("receivedUserInfo: Received new user info for session %u", sessionID());
  {
    auto key = keyFor(userInfo);
    MutexLock lock(_mutex);
    _userInfo = userInfo;
    _correlationKey = std::move(key);
  }
  updateSessionWithDefaultSessionInfo();
}

Dictionary ReportingdSession::diagnosis() const {
  const auto info = sessionInfo(), sender = userInfo();
  const auto textOf = [](const std::optional<Dictionary>& from, const char* key) {
    const auto text = from ? from->text(key) : std::nullopt;
    return text ? Value(*text) : Value();
  };
  const auto set = backends();
  return Dictionary{
      {"process", static_cast<std::int64_t>(_connection->peer().process)},
      {"user", static_cast<std::int64_t>(user())},
      {"sessionID", static_cast<std::int64_t>(sessionID())},
      {"clientType", info ? integerForKey(*info, kVeskReportingSessionInfoClientType).value_or(0) : 0},
      {"clientName", textOf(sender, kVeskReportingUserInfoClientName)},
      {"serviceName", textOf(sender, kVeskReportingUserInfoServiceName)},
      {"level", static_cast<std::int64_t>(getSessionHierarchy())},
      {"storebagVersion", storebagVersion().value_or("")},
      {"backends", set ? describeStates(*set) : Dictionary()}};
}

// --- Family

std::int32_t ReportingdSession::getSessionHierarchy() const {
  auto set = backends();
  auto backend = set ? findBackend(*set, kVeskReportingBackendHTTPPost) : nullptr;
  return backend ? backend->hierarchy() : 0;
}

void ReportingdSession::updateCombinedSessionID() {
  auto parentID = _sessionDelegate->parentSessionIDStringForSession(*this);
  if (!parentID) return;
  std::string combined = *parentID + "." + _sessionIDString;
  VESK_LOG_DEBUG("updateCombinedSessionID: Updating combined session ID '%s' for session %u backends",
                 combined.c_str(), sessionID());
  auto set = backends();
  if (!set) return;
  for (const auto& [name, backend] : *set) backend->setCorrelatedSessionID(combined);
}

void ReportingdSession::syncReportingStates() {
  RecursiveMutexLock monitor(_sessionDelegate->monitor());
  const auto parent = _sessionDelegate->parentSessionForChild(*this);
  const auto set = backends();
  if (!set) return;
  if (parent) {
    vesk::syncReportingStates(*set, parent->backends().get());
  } else {
    noteMissingParent(*set, sessionID());
  }
}

void ReportingdSession::shutdownSessionAggregation() {
  VESK_LOG_DEBUG("shutdownSessionAggregation: Disable aggregation module for session %u", sessionID());
  _aggregator.shutdown();
}

std::optional<BackendNames> ReportingdSession::fetchReportingStates() const {
  const auto set = backends();
  if (!set) return std::nullopt;
  return vesk::fetchReportingStates(*set);
}

std::optional<Value> ReportingdSession::samplingThresholdWithBackendName(const std::string& name) const {
  const auto set = backends();
  const auto backend = set ? findBackend(*set, name) : nullptr;
  return backend ? backend->samplingThreshold() : std::nullopt;
}

}  // namespace vesk
