#include <VeskReporting/VeskReporting.h>

#include <algorithm>
#include <cerrno>
#include <exception>

#include "client/CallBuilding.h"
#include "client/ClientSession.h"
#include "platform/log/SystemLog.h"

namespace vesk {

class VeskReporting::Implementation : public ClientSession {
 public:
  using ClientSession::ClientSession;
};

namespace {

using Timeout = std::chrono::milliseconds;

// Descriptors are scarcer than memory: with the default limit, 16 may wait.
constexpr std::size_t kMemoryOfDescriptor = std::size_t{512} << 10;

// The three forms of a call, which `make` builds from `arguments`. Fails if the session could not be created.

template <class Session, class Make, class... Arguments>
ReportingStatus post(const std::unique_ptr<Session>& session, const Make& make,
                     Arguments&... arguments) noexcept {
  return session ? session->post([&] { return make(arguments...); }) : ReportingStatus::OutOfResources;
}

template <class Answer, class Session, class Make, class... Arguments>
ReportingStatus ask(const std::unique_ptr<Session>& session, ReportingCallback<Answer>& callback,
                    Timeout timeout, const Make& make, Arguments&... arguments) noexcept {
  if (!session) return ReportingStatus::OutOfResources;
  return session->template ask<Answer>([&] { return make(arguments...); }, std::move(callback), timeout);
}

template <class Answer, class Session, class Make, class... Arguments>
ReportingResult<Answer> wait(const std::unique_ptr<Session>& session, Timeout timeout, const Make& make,
                             Arguments&... arguments) noexcept {
  if (!session) return {ReportingStatus::OutOfResources, {}, {}};
  return session->template wait<Answer>([&] { return make(arguments...); }, timeout);
}

ClientCall setInfo(Dictionary& sessionInfo, std::optional<Dictionary>& userInfo,
                   std::vector<std::string>& frameworks, AggregationHandler& handler) {
  ClientCall call = makeCall(CallEffect::Configures, wire::kSetSessionInfo, std::move(sessionInfo),
                             std::move(userInfo), std::move(frameworks), static_cast<bool>(handler));
  if (handler) call.aggregation = std::make_shared<const AggregationHandler>(std::move(handler));
  return call;
}

ClientCall start() { return makeCall(CallEffect::Starts, wire::kStartConfig); }

ClientCall states(std::optional<Dictionary>& userInfo) {
  return makeCall(CallEffect::ChangesUserInfo, wire::kFetchStates, std::move(userInfo));
}

ClientCall displayURL() { return makeCall(wire::kFetchDisplayURL); }

ClientCall message(std::uint16_t category, std::uint16_t type, std::optional<Dictionary>& payload) {
  return makeCall(wire::kSendMessageWithCategory, category, type, std::move(payload));
}

ClientCall messageOf(Dictionary& parameters) {
  return makeCall(wire::kSendMessageWithDictionary, std::move(parameters));
}

ClientCall messageOnce(Dictionary& sessionInfo, std::optional<Dictionary>& userInfo, std::uint16_t category,
                       std::uint16_t type, std::optional<Dictionary>& payload) {
  return makeCall(wire::kSendMessageWithSessionInfo, std::move(sessionInfo), std::move(userInfo), category,
                  type, std::move(payload));
}

ClientCall flush() { return makeCall(wire::kFlushMessages); }

ClientCall logDataUpload(List& logData) { return makeCall(wire::kUploadLogData, std::move(logData)); }

ClientCall fileUpload(FileToUpload& file) {
  const IPCDescriptor descriptor{file.descriptor.get()};
  ClientCall call = makeCall(wire::kUploadFile, std::move(file.url), descriptor);
  call.call.descriptor = descriptor;
  call.descriptor = GuardedDescriptor(std::move(file.descriptor));
  call.memory = std::max(call.memory, kMemoryOfDescriptor);
  return call;
}

ReportingStatus statusOf(const Error& error) noexcept {
  bool isScarce = error.number == EMFILE || error.number == ENFILE || error.number == ENOMEM;
  return isScarce ? ReportingStatus::OutOfResources : ReportingStatus::FileUnavailable;
}

}  // namespace

VeskReporting::VeskReporting(const ReportingOptions& options) noexcept {
  try {
    _implementation = std::make_unique<Implementation>(options);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("VeskReporting: no session could be made: %s", error.what());
  }
}

VeskReporting::~VeskReporting() {
  // In a forked process the thread is gone, along with any locks it held: the implementation must be leaked.
  if (_implementation && !_implementation->isOurs()) static_cast<void>(_implementation.release());
}

ReportingResult<std::monostate> VeskReporting::connect(Timeout timeout) noexcept {
  return wait<std::monostate>(_implementation, timeout, [] { return ClientCall{}; });
}

bool VeskReporting::isConnected() const noexcept { return _implementation && _implementation->isConnected(); }

ReportingDrops VeskReporting::drops() const noexcept {
  return _implementation ? _implementation->drops() : ReportingDrops{};
}

ReportingStatus VeskReporting::setSessionInfo(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                              std::vector<std::string> frameworksToCheck,
                                              AggregationHandler aggregationHandler) noexcept {
  return post(_implementation, setInfo, sessionInfo, userInfo, frameworksToCheck, aggregationHandler);
}

ReportingStatus VeskReporting::setSessionInfo(const ReportingSession& session) noexcept {
  try {
    MutableDictionary userInfo;
    if (!session.clientName.empty()) userInfo.set(kVeskReportingUserInfoClientName, session.clientName);
    if (!session.serviceName.empty()) userInfo.set(kVeskReportingUserInfoServiceName, session.serviceName);
    return setSessionInfo({{kVeskReportingSessionInfoSessionID, session.sessionID},
                           {kVeskReportingSessionInfoClientType, session.clientType},
                           {kVeskReportingSessionInfoClientVersion, int{session.clientVersion}},
                           {kVeskReportingSessionInfoRequireUserInfo, session.requireUserInfo},
                           {kVeskReportingSessionInfoBatchEvent, session.batchEvents}},
                          userInfo.empty() ? std::nullopt : std::optional(userInfo.share()));
  } catch (const std::exception&) {
    return ReportingStatus::OutOfResources;
  }
}

ReportingResult<BackendNamesAnswer> VeskReporting::startConfig(Timeout timeout) noexcept {
  return wait<BackendNamesAnswer>(_implementation, timeout, start);
}

ReportingStatus VeskReporting::startConfig(ReportingCallback<BackendNamesAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, start);
}

ReportingResult<BackendNamesAnswer> VeskReporting::fetchStates(std::optional<Dictionary> userInfo,
                                                               Timeout timeout) noexcept {
  return wait<BackendNamesAnswer>(_implementation, timeout, states, userInfo);
}

ReportingStatus VeskReporting::fetchStates(std::optional<Dictionary> userInfo,
                                           ReportingCallback<BackendNamesAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, states, userInfo);
}

ReportingResult<std::string> VeskReporting::fetchDisplayURL(Timeout timeout) noexcept {
  return wait<std::string>(_implementation, timeout, displayURL);
}

ReportingStatus VeskReporting::fetchDisplayURL(ReportingCallback<std::string> callback,
                                               Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, displayURL);
}

ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                           std::optional<Dictionary> payload) noexcept {
  return post(_implementation, message, category, type, payload);
}

ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                           std::optional<Dictionary> payload,
                                           ReportingCallback<MessageAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, message, category, type, payload);
}

ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(std::uint16_t category, std::uint16_t type,
                                                                 std::optional<Dictionary> payload,
                                                                 Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, message, category, type, payload);
}

ReportingStatus VeskReporting::sendMessage(Dictionary parameters) noexcept {
  return post(_implementation, messageOf, parameters);
}

ReportingStatus VeskReporting::sendMessage(Dictionary parameters, ReportingCallback<MessageAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, messageOf, parameters);
}

ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(Dictionary parameters,
                                                                 Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, messageOf, parameters);
}

ReportingStatus VeskReporting::flushMessages() noexcept { return post(_implementation, flush); }

ReportingStatus VeskReporting::flushMessages(ReportingCallback<MessageAnswer> callback,
                                             Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, flush);
}

ReportingResult<MessageAnswer> VeskReporting::flushMessagesAndWait(Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, flush);
}

ReportingResult<bool> VeskReporting::uploadFile(const std::string& path, Timeout timeout) noexcept {
  try {
    auto file = openToUpload(path);
    if (!file) return {statusOf(file.error()), false, file.error().text};
    return wait<bool>(_implementation, timeout, fileUpload, *file);
  } catch (const std::exception&) {
    return {ReportingStatus::OutOfResources, false, {}};
  }
}

ReportingStatus VeskReporting::uploadFile(const std::string& path, ReportingCallback<bool> callback,
                                          Timeout timeout) noexcept {
  try {
    auto file = openToUpload(path);
    return file ? ask(_implementation, callback, timeout, fileUpload, *file) : statusOf(file.error());
  } catch (const std::exception&) {
    return ReportingStatus::OutOfResources;
  }
}

ReportingResult<bool> VeskReporting::uploadLogData(List logData, Timeout timeout) noexcept {
  return wait<bool>(_implementation, timeout, logDataUpload, logData);
}

ReportingStatus VeskReporting::uploadLogData(List logData, ReportingCallback<bool> callback,
                                             Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, logDataUpload, logData);
}

ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                               std::uint16_t category, std::uint16_t type,
                                               std::optional<Dictionary> payload) noexcept {
  return post(_implementation, messageOnce, sessionInfo, userInfo, category, type, payload);
}

ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                               std::uint16_t category, std::uint16_t type,
                                               std::optional<Dictionary> payload,
                                               ReportingCallback<std::string> callback,
                                               Timeout timeout) noexcept {
  return ask(_implementation, callback, timeout, messageOnce, sessionInfo, userInfo, category, type, payload);
}

ReportingResult<std::string> VeskReporting::sendMessageOnceAndWait(Dictionary sessionInfo,
                                                                   std::optional<Dictionary> userInfo,
                                                                   std::uint16_t category, std::uint16_t type,
                                                                   std::optional<Dictionary> payload,
                                                                   Timeout timeout) noexcept {
  return wait<std::string>(_implementation, timeout, messageOnce, sessionInfo, userInfo, category, type,
                           payload);
}

}  // namespace vesk
