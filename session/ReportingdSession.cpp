#include "session/ReportingdSession.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>

#include "platform/crypto/Base64.h"
#include "platform/crypto/UUID.h"
#include "platform/log/SystemLog.h"
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

// The batch has been posted already. If its answer were too large to send, the client would send the messages
// again.
std::optional<std::string> fittingAnswer(std::optional<std::string> answer) {
  if (!answer || answer->size() <= kMaxAnswerBytes) return answer;
  const std::string notice = "\n[cut: this answer has " + std::to_string(answer->size()) + " bytes]";
  std::size_t end = kMaxAnswerBytes - notice.size();
  while (end > 0 && (static_cast<unsigned char>((*answer)[end]) & 0xC0) == 0x80) --end;
  answer->resize(end);
  *answer += notice;
  return answer;
}

bool requiresUserInfo(const Dictionary& sessionInfo) {
  return booleanForKey(sessionInfo, kVeskReportingSessionInfoRequireUserInfo).value_or(false);
}

}  // namespace

ReportingdSession::ReportingdSession(std::shared_ptr<ReportingdSessionDelegate> sessionDelegate,
                                     std::shared_ptr<IPCConnection> connection,
                                     const SessionServices& services)
    : _sessionDelegate(std::move(sessionDelegate)),
      _connection(std::move(connection)),
      _services(services),
      _sessionIDString(freshIdentity()),
      _correlationKey(keyFor(std::nullopt)) {
  VESK_LOG_DEBUG("initWithSessionDelegate: ReportingdSession initWithSessionDelegate:%s",
                 _sessionDelegate->description().c_str());
  copyUniqueDeviceID(_deviceid.data(), _deviceid.size());
  VESK_LOG_DEBUG("initWithSessionDelegate: Initialized session with UUID %s", _sessionIDString.c_str());
}

ReportingdSession::~ReportingdSession() {
  VESK_LOG_DEBUG("dealloc: ReportingdSession dealloc: %u", sessionID());
  _isEnding = true;
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
  MutexLock lock(_mutex);
  _sessionInfo = sessionInfo;
  _frameworks = frameworksToCheck;
  _userInfo = userInfo;
  _correlationKey = std::move(key);
  _hasAggregator = hasAggregationBlock;
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
  uploadFileWithURL(fileURL, extensionToken, std::move(completionHandler));
}

void ReportingdSession::sendMessageWithSessionInfo(const Dictionary& sessionInfo,
                                                   const std::optional<Dictionary>& userInfo,
                                                   std::uint16_t category, std::uint16_t type,
                                                   const std::optional<Dictionary>& payload,
                                                   Reply<std::string> reply) {
  if (!integerForKey(sessionInfo, kVeskReportingSessionInfoClientType) ||
      !integerForKey(sessionInfo, kVeskReportingSessionInfoSessionID)) {
    VESK_LOG_ERROR("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    _services.backends.counters.count("session", DropReason::InvalidMessage);
    return;  // destroying the reply uncalled sends an error
  }
  {
    MutexLock lock(_mutex);
    _sessionID = sessionIDIn(sessionInfo);
    _sessionInfo = sessionInfo;
  }
  receivedUserInfo(userInfo);
  VESK_LOG_DEBUG("sendMessageWithSessionInfo: Sending message with session info for session %u", sessionID());
  auto storebag = _sessionDelegate->storebagForSession(*this);
  if (!storebag) {
    _services.backends.counters.count("session", DropReason::NoBackend);
    reply("storebag not available");
    return;
  }
  sendSingleMessage(_services, _connection->peer().user, sessionInfo, userInfo, storebag, category, type,
                    payload);
  reply("finished");
}

}  // namespace vesk
