#include "session/Dispatch.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <array>
#include <climits>

#include "platform/files/FileURL.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "protocol/ClientSessionInterface.h"
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

std::optional<MessageParameters> messageFrom(const Dictionary& parameters) {
  const auto category = unsignedForKey(parameters, kVeskReportingMessageParametersCategory);
  if (!category) {
    VESK_LOG_DEBUG("sendMessageWithDictionary: Missing mandatory parameter 'category'");
    return std::nullopt;
  }
  const auto type = unsignedForKey(parameters, kVeskReportingMessageParametersType);
  if (!type) {
    VESK_LOG_DEBUG("sendMessageWithDictionary: Missing mandatory parameter 'type'");
    return std::nullopt;
  }
  const auto flag = unsignedForKey(parameters, kVeskReportingMessageParametersFlag).value_or(0);
  return MessageParameters{.category = static_cast<std::uint16_t>(*category),
                           .type = static_cast<std::uint16_t>(*type),
                           .payload = parameters.dictionary(kVeskReportingMessageParametersPayload),
                           .flag = static_cast<std::int32_t>(flag)};
}

std::optional<std::string> dispatchMessage(const BackendSet& backends, const MessageParameters& message,
                                           const timeval& timestamp) {
  AnswerChoice answers;
  for (const auto& [name, backend] : backends) {
    auto answer =
        backend->sendMessage(message.payload, timestamp, message.category, message.type, message.flag);
    if (answer) writeToLogFile("[%@ -> sendMessageWithDictionary] %@", name, *answer);
    answers.offer(name, answer);
  }
  return std::move(answers).chosen();
}

std::optional<std::string> flushBackends(const BackendSet& backends) {
  AnswerChoice answers;
  for (const auto& [name, backend] : backends) {
    auto answer = backend->flushMessages();
    if (answer) writeToLogFile("[%@ -> flushMessages] %@", name, *answer);
    answers.offer(name, answer);
  }
  return std::move(answers).chosen();
}

// The batch has been posted already. If its answer were too large to send, the client would repeat it.
std::optional<std::string> fittingAnswer(std::optional<std::string> answer) {
  if (!answer || answer->size() <= kMaxAnswerBytes) return answer;
  const std::string notice = "\n[cut: this answer has " + std::to_string(answer->size()) + " bytes]";
  std::size_t end = kMaxAnswerBytes - notice.size();
  while (end > 0 && (static_cast<unsigned char>((*answer)[end]) & 0xC0) == 0x80) --end;
  answer->resize(end);
  *answer += notice;
  return answer;
}

void cleanupBackends(const BackendSet& backends) {
  for (const auto& [name, backend] : backends) backend->cleanup();
}

bool uploadFileWithURL(const BackendSet* backends, const std::string& fileURL,
                       const std::string& extensionToken, const Outcomes& outcomes) {
  std::string path = pathFromFileURL(fileURL);
  std::string url = fileURL;
  bool succeeded = false;
  if (path.size() >= PATH_MAX || url.size() > kLongestURL) {
    // A client must not fill the log with a file name.
    path = cutToWholeCharacters(path, kShownOfTooLong);
    url = cutToWholeCharacters(url, kShownOfTooLong);
  } else if (backends) {
    for (const auto& [name, backend] : *backends) {
      if (backend->uploadFileAtPath(path, extensionToken)) succeeded = true;
    }
  }
  if (succeeded) {
    VESK_LOG_DEBUG("uploadFileWithURL: File upload successful for %s", path.c_str());
  } else {
    VESK_LOG_ERROR("uploadFileWithURL: File upload failed for %s", path.c_str());
    outcomes.count("upload", DropReason::UploadFailed);
  }
  writeToLogFile("[uploadFileWithURL] Upload %@ for file %@", succeeded ? "succeeded" : "failed",
                 encodedForURL(url));
  return succeeded;
}

bool uploadLogData(const BackendSet* backends, const List& logData, const Outcomes& outcomes) {
  VESK_LOG_DEBUG("uploadLogData: Uploading log data array: %s", describe(logData).c_str());
  bool succeeded = false;
  if (backends) {
    for (const auto& [name, backend] : *backends) {
      if (backend->uploadLogData(logData)) succeeded = true;
    }
  }
  if (succeeded) {
    VESK_LOG_DEBUG("uploadLogData: Log data array upload successful");
  } else {
    VESK_LOG_ERROR("uploadLogData: Log data array upload failed");
    outcomes.count("upload", DropReason::UploadFailed);
  }
  return succeeded;
}

void sendMessageWithSessionInfo(const SessionServices& services, const BackendClient& client,
                                const std::optional<Dictionary>& sessionInfo,
                                const std::optional<Dictionary>& userInfo,
                                const std::optional<Dictionary>& storebag, std::uint16_t category,
                                std::uint16_t type, const std::optional<Dictionary>& payload) {
  const Dictionary info = sessionInfo.value_or(Dictionary());
  Outcomes outcomes = outcomesOfSession(client, services.backends);
  outcomes.setSession(
      static_cast<std::uint32_t>(integerForKey(info, kVeskReportingSessionInfoSessionID).value_or(0)),
      static_cast<std::int32_t>(integerForKey(info, kVeskReportingSessionInfoClientType).value_or(0)));
  VESK_LOG_DEBUG("sendMessageWithSessionInfo: Sending single message with sessionID %ld",
                 static_cast<long>(integerForKey(info, kVeskReportingSessionInfoSessionID).value_or(0)));
  if (!sessionInfo || !storebag) {
    VESK_LOG_ERROR("RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters");
    outcomes.count("message", DropReason::NoBackend);
    return;
  }
  std::array<char, 41> deviceID{};
  copyUniqueDeviceID(deviceID.data(), deviceID.size());
  auto backends = createBackends(storebag, sessionInfo, userInfo, deviceID.data(), services.libraryVersion,
                                 client, services.backends);
  if (!backends) {
    VESK_LOG_ERROR("sendMessageWithSessionInfo: No backends available to send single message");
    outcomes.count("message", DropReason::NoBackend);
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
