// Dispatches a session's messages to its backends.
#include <VeskReporting/VeskReportingKeys.h>

#include <climits>

#include "platform/files/FileURL.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "session/ReportingdSession.h"
#include "util/MessageLog.h"
#include "util/ReportingdUtil.h"
#include "util/URLQuery.h"

namespace vesk {

namespace {

// In a file's URL each byte of the path may be percent-encoded.
constexpr std::size_t kLongestURL = 3 * PATH_MAX + sizeof "file://localhost";
constexpr std::size_t kShownOfTooLong = 256;

/// Picks the answer for the client: that of the HTTP-post backend, otherwise the dashboard's, otherwise none.
class AnswerChoice {
 public:
  void offer(const std::string& backendName, const std::optional<std::string>& answer) {
    if (!answer || answer->empty()) return;
    if (backendName == kVeskReportingBackendHTTPPost) _chosen = answer;
    if (backendName == kVeskReportingBackendDashboard && !_chosen) _chosen = answer;
  }
  std::optional<std::string> chosen() && { return std::move(_chosen); }

 private:
  std::optional<std::string> _chosen;
};

std::optional<std::uint32_t> unsignedForKey(const Dictionary& parameters, const char* key) {
  auto number = integerForKey(parameters, key);
  if (!number) return std::nullopt;
  return static_cast<std::uint32_t>(*number);
}

}  // namespace

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
    if (!_isEnding) _services.backends.counters.count("session", DropReason::NoBackend);
    return std::nullopt;
  }
  auto category = unsignedForKey(parameters, kVeskReportingMessageParametersCategory);
  if (!category) {
    VESK_LOG_DEBUG("sendMessageWithDictionary: Missing mandatory parameter 'category'");
    _services.backends.counters.count("session", DropReason::InvalidMessage);
    return std::nullopt;
  }
  auto type = unsignedForKey(parameters, kVeskReportingMessageParametersType);
  if (!type) {
    VESK_LOG_DEBUG("sendMessageWithDictionary: Missing mandatory parameter 'type'");
    _services.backends.counters.count("session", DropReason::InvalidMessage);
    return std::nullopt;
  }
  return dispatchMessage(*set, static_cast<std::uint16_t>(*category), static_cast<std::uint16_t>(*type),
                         parameters.dictionary(kVeskReportingMessageParametersPayload),
                         unsignedForKey(parameters, kVeskReportingMessageParametersFlag).value_or(0));
}

std::optional<std::string> ReportingdSession::dispatchMessage(const BackendSet& backends,
                                                              std::uint16_t category, std::uint16_t type,
                                                              const std::optional<Dictionary>& payload,
                                                              std::uint32_t flag) {
  timeval now = timevalFrom(_services.backends.clock.now());
  aggregateMessage(sessionInfo(), secondsFromTimeval(now), category, type, payload);
  AnswerChoice answers;
  for (const auto& [name, backend] : backends) {
    auto answer = backend->sendMessage(payload, now, category, type, static_cast<std::int32_t>(flag));
    if (answer) writeToLogFile("[%@ -> sendMessageWithDictionary] %@", name, *answer);
    answers.offer(name, answer);
  }
  return std::move(answers).chosen();
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

std::optional<std::string> ReportingdSession::flushBackends(const BackendSet& backends) {
  AnswerChoice answers;
  for (const auto& [name, backend] : backends) {
    auto answer = backend->flushMessages();
    if (answer) writeToLogFile("[%@ -> flushMessages] %@", name, *answer);
    answers.offer(name, answer);
  }
  return std::move(answers).chosen();
}

void ReportingdSession::uploadFileWithURL(const std::string& fileURL, const std::string& extensionToken,
                                          Reply<bool> completionHandler) {
  std::string path = pathFromFileURL(fileURL);
  std::string url = fileURL;
  bool succeeded = false;
  if (path.size() >= PATH_MAX || url.size() > kLongestURL) {
    // A client must not fill the log with a file name.
    path = cutToWholeCharacters(path, kShownOfTooLong);
    url = cutToWholeCharacters(url, kShownOfTooLong);
  } else if (auto set = backends()) {
    for (const auto& [name, backend] : *set) {
      if (backend->uploadFileAtPath(path, extensionToken)) succeeded = true;
    }
  }
  if (succeeded) {
    VESK_LOG_DEBUG("uploadFileWithURL: File upload successful for %s", path.c_str());
  } else {
    VESK_LOG_ERROR("uploadFileWithURL: File upload failed for %s", path.c_str());
    _services.backends.counters.count("session", DropReason::UploadFailed);
  }
  writeToLogFile("[uploadFileWithURL] Upload %@ for file %@", succeeded ? "succeeded" : "failed",
                 encodedForURL(url));
  completionHandler(succeeded);
}

void ReportingdSession::uploadLogData(const List& logData,
                                      Reply<bool, std::optional<std::string>> completionHandler) {
  VESK_LOG_DEBUG("uploadLogData: Uploading log data array: %s", describe(logData).c_str());
  bool succeeded = false;
  if (auto set = backends()) {
    for (const auto& [name, backend] : *set) {
      if (backend->uploadLogData(logData)) succeeded = true;
    }
  }
  if (succeeded) {
    VESK_LOG_DEBUG("uploadLogData: Log data array upload successful");
  } else {
    VESK_LOG_ERROR("uploadLogData: Log data array upload failed");
    _services.backends.counters.count("session", DropReason::UploadFailed);
  }
  completionHandler(succeeded, std::nullopt);
}

void ReportingdSession::sendSingleMessage(const SessionServices& services, uid_t user,
                                          const std::optional<Dictionary>& sessionInfo,
                                          const std::optional<Dictionary>& userInfo,
                                          const std::optional<Dictionary>& storebag, std::uint16_t category,
                                          std::uint16_t type, const std::optional<Dictionary>& payload) {
  const Dictionary info = sessionInfo.value_or(Dictionary());
  VESK_LOG_DEBUG("sendMessageWithSessionInfo: Sending single message with sessionID %ld",
                 static_cast<long>(integerForKey(info, kVeskReportingSessionInfoSessionID).value_or(0)));
  if (!sessionInfo || !storebag) {
    VESK_LOG_ERROR("RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters");
    services.backends.counters.count("session", DropReason::NoBackend);
    return;
  }
  std::array<char, 41> deviceID{};
  copyUniqueDeviceID(deviceID.data(), deviceID.size());
  auto backends = createBackends(storebag, sessionInfo, userInfo, deviceID.data(), services.libraryVersion,
                                 user, services.backends);
  if (!backends) {
    VESK_LOG_ERROR("sendMessageWithSessionInfo: No backends available to send single message");
    services.backends.counters.count("session", DropReason::NoBackend);
    return;
  }
  if (userInfo && !booleanForKey(info, kVeskReportingSessionInfoRequireUserInfo).value_or(false)) {
    VESK_LOG_WARNING("sendMessageWithSessionInfo: user info provided without requiring it.");
  }
  timeval now = timevalFrom(services.backends.clock.now());
  for (const auto& [name, backend] : *backends) {
    backend->updateState();
    auto answer = backend->sendMessage(payload, now, category, type, 0);
    if (answer) writeToLogFile("[%@ -> sendMessageWithSessionInfo] %@", name, *answer);
  }
  // A storebag may enable batching; the batch ends here.
  flushBackends(*backends);
  cleanupBackends(*backends);
}

}  // namespace vesk
