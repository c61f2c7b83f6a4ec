#include <VeskReporting/VeskReporting.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
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

// Descriptors are dearer than memory: with the default bound, 16 may wait.
constexpr std::size_t kMemoryOfDescriptor = std::size_t{512} << 10;

// A session that could not be made refuses everything.
template <class Session, class Make>
ReportingStatus post(const std::unique_ptr<Session>& session, const Make& make) noexcept {
  return session ? session->post(make) : ReportingStatus::OutOfResources;
}

template <class Answer, class Session, class Make>
ReportingStatus ask(const std::unique_ptr<Session>& session, ReportingCallback<Answer>& callback,
                    Timeout timeout, const Make& make) noexcept {
  return session ? session->template ask<Answer>(make, std::move(callback), timeout)
                 : ReportingStatus::OutOfResources;
}

template <class Answer, class Session, class Make>
ReportingResult<Answer> wait(const std::unique_ptr<Session>& session, Timeout timeout,
                             const Make& make) noexcept {
  if (!session) return {ReportingStatus::OutOfResources, {}, {}};
  return session->template wait<Answer>(make, timeout);
}

ClientCall withEffect(ClientCall call, CallEffect effect) {
  call.effect = effect;
  return call;
}

ClientCall makeSetSessionInfo(Dictionary& sessionInfo, std::optional<Dictionary>& userInfo,
                              std::vector<std::string>& frameworks, AggregationHandler& handler) {
  ClientCall call = makeCall(wire::kSetSessionInfo, std::move(sessionInfo), std::move(userInfo),
                             std::move(frameworks), static_cast<bool>(handler));
  if (handler) call.aggregation = std::make_shared<const AggregationHandler>(std::move(handler));
  return withEffect(std::move(call), CallEffect::Configures);
}

ClientCall makeStartConfig() { return withEffect(makeCall(wire::kStartConfig), CallEffect::Starts); }

ClientCall makeFetchStates(std::optional<Dictionary>& userInfo) {
  return withEffect(makeCall(wire::kFetchStates, std::move(userInfo)), CallEffect::ChangesUserInfo);
}

ClientCall makeMessage(std::uint16_t category, std::uint16_t type, std::optional<Dictionary>& payload) {
  return makeCall(wire::kSendMessageWithCategory, category, type, std::move(payload));
}

ClientCall makeMessageOnce(Dictionary& sessionInfo, std::optional<Dictionary>& userInfo,
                           std::uint16_t category, std::uint16_t type, std::optional<Dictionary>& payload) {
  return makeCall(wire::kSendMessageWithSessionInfo, std::move(sessionInfo), std::move(userInfo), category,
                  type, std::move(payload));
}

ReportingStatus statusOf(const FileToUpload& file) noexcept {
  bool isScarce = file.error == EMFILE || file.error == ENFILE || file.error == ENOMEM;
  return isScarce ? ReportingStatus::OutOfResources : ReportingStatus::FileUnavailable;
}

ClientCall makeUpload(FileToUpload& file) {
  ClientCall call = makeCall(wire::kUploadFile, std::move(file.url), IPCDescriptor{file.descriptor.get()});
  call.descriptor = GuardedDescriptor(std::move(file.descriptor));
  call.memory = std::max(call.memory, kMemoryOfDescriptor);
  return call;
}

}  // namespace

VeskReporting::VeskReporting(ReportingOptions options) noexcept {
  try {
    _implementation = std::make_unique<Implementation>(options);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("VeskReporting: no session could be made: %s", error.what());
  }
}

VeskReporting::~VeskReporting() {
  // In a forked process the thread is gone, whatever it held: all that can be done is to let go.
  if (_implementation && !_implementation->isOurs()) static_cast<void>(_implementation.release());
}

ReportingResult<std::monostate> VeskReporting::connect(Timeout timeout) noexcept {
  if (!_implementation) return {ReportingStatus::OutOfResources, {}, {}};
  return _implementation->connect(timeout);
}

bool VeskReporting::isConnected() const noexcept {
  return _implementation && _implementation->isOurs() && _implementation->worker().isConnected();
}

ReportingDrops VeskReporting::drops() const noexcept {
  return _implementation ? _implementation->worker().drops().read() : ReportingDrops{};
}

ReportingStatus VeskReporting::setSessionInfo(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                              std::vector<std::string> frameworksToCheck,
                                              AggregationHandler aggregationHandler) noexcept {
  return post(_implementation, [&] {
    return makeSetSessionInfo(sessionInfo, userInfo, frameworksToCheck, aggregationHandler);
  });
}

ReportingResult<BackendNamesAnswer> VeskReporting::startConfig(Timeout timeout) noexcept {
  return wait<BackendNamesAnswer>(_implementation, timeout, makeStartConfig);
}

ReportingStatus VeskReporting::startConfig(ReportingCallback<BackendNamesAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask<BackendNamesAnswer>(_implementation, callback, timeout, makeStartConfig);
}

ReportingResult<BackendNamesAnswer> VeskReporting::fetchStates(std::optional<Dictionary> userInfo,
                                                               Timeout timeout) noexcept {
  return wait<BackendNamesAnswer>(_implementation, timeout, [&] { return makeFetchStates(userInfo); });
}

ReportingStatus VeskReporting::fetchStates(std::optional<Dictionary> userInfo,
                                           ReportingCallback<BackendNamesAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask<BackendNamesAnswer>(_implementation, callback, timeout,
                                 [&] { return makeFetchStates(userInfo); });
}

ReportingResult<std::string> VeskReporting::fetchDisplayURL(Timeout timeout) noexcept {
  return wait<std::string>(_implementation, timeout, [] { return makeCall(wire::kFetchDisplayURL); });
}

ReportingStatus VeskReporting::fetchDisplayURL(ReportingCallback<std::string> callback,
                                               Timeout timeout) noexcept {
  return ask<std::string>(_implementation, callback, timeout,
                          [] { return makeCall(wire::kFetchDisplayURL); });
}

ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                           std::optional<Dictionary> payload) noexcept {
  return post(_implementation, [&] { return makeMessage(category, type, payload); });
}

ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                           std::optional<Dictionary> payload,
                                           ReportingCallback<MessageAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask<MessageAnswer>(_implementation, callback, timeout,
                            [&] { return makeMessage(category, type, payload); });
}

ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(std::uint16_t category, std::uint16_t type,
                                                                 std::optional<Dictionary> payload,
                                                                 Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, [&] { return makeMessage(category, type, payload); });
}

ReportingStatus VeskReporting::sendMessage(Dictionary parameters) noexcept {
  return post(_implementation,
              [&] { return makeCall(wire::kSendMessageWithDictionary, std::move(parameters)); });
}

ReportingStatus VeskReporting::sendMessage(Dictionary parameters, ReportingCallback<MessageAnswer> callback,
                                           Timeout timeout) noexcept {
  return ask<MessageAnswer>(_implementation, callback, timeout, [&] {
    return makeCall(wire::kSendMessageWithDictionary, std::move(parameters));
  });
}

ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(Dictionary parameters,
                                                                 Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, [&] {
    return makeCall(wire::kSendMessageWithDictionary, std::move(parameters));
  });
}

ReportingStatus VeskReporting::flushMessages() noexcept {
  return post(_implementation, [] { return makeCall(wire::kFlushMessages); });
}

ReportingStatus VeskReporting::flushMessages(ReportingCallback<MessageAnswer> callback,
                                             Timeout timeout) noexcept {
  return ask<MessageAnswer>(_implementation, callback, timeout,
                            [] { return makeCall(wire::kFlushMessages); });
}

ReportingResult<MessageAnswer> VeskReporting::flushMessagesAndWait(Timeout timeout) noexcept {
  return wait<MessageAnswer>(_implementation, timeout, [] { return makeCall(wire::kFlushMessages); });
}

ReportingResult<bool> VeskReporting::uploadFile(const std::string& path, Timeout timeout) noexcept {
  try {
    FileToUpload file = openToUpload(path);
    if (!file.descriptor) return {statusOf(file), false, std::strerror(file.error)};
    return wait<bool>(_implementation, timeout, [&] { return makeUpload(file); });
  } catch (const std::exception&) {
    return {ReportingStatus::OutOfResources, false, {}};
  }
}

ReportingStatus VeskReporting::uploadFile(const std::string& path, ReportingCallback<bool> callback,
                                          Timeout timeout) noexcept {
  try {
    FileToUpload file = openToUpload(path);
    if (!file.descriptor) return statusOf(file);
    return ask<bool>(_implementation, callback, timeout, [&] { return makeUpload(file); });
  } catch (const std::exception&) {
    return ReportingStatus::OutOfResources;
  }
}

ReportingResult<bool> VeskReporting::uploadLogData(List logData, Timeout timeout) noexcept {
  return wait<bool>(_implementation, timeout,
                    [&] { return makeCall(wire::kUploadLogData, std::move(logData)); });
}

ReportingStatus VeskReporting::uploadLogData(List logData, ReportingCallback<bool> callback,
                                             Timeout timeout) noexcept {
  return ask<bool>(_implementation, callback, timeout,
                   [&] { return makeCall(wire::kUploadLogData, std::move(logData)); });
}

ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                               std::uint16_t category, std::uint16_t type,
                                               std::optional<Dictionary> payload) noexcept {
  return post(_implementation,
              [&] { return makeMessageOnce(sessionInfo, userInfo, category, type, payload); });
}

ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                                               std::uint16_t category, std::uint16_t type,
                                               std::optional<Dictionary> payload,
                                               ReportingCallback<std::string> callback,
                                               Timeout timeout) noexcept {
  return ask<std::string>(_implementation, callback, timeout,
                          [&] { return makeMessageOnce(sessionInfo, userInfo, category, type, payload); });
}

ReportingResult<std::string> VeskReporting::sendMessageOnceAndWait(Dictionary sessionInfo,
                                                                   std::optional<Dictionary> userInfo,
                                                                   std::uint16_t category, std::uint16_t type,
                                                                   std::optional<Dictionary> payload,
                                                                   Timeout timeout) noexcept {
  return wait<std::string>(_implementation, timeout,
                           [&] { return makeMessageOnce(sessionInfo, userInfo, category, type, payload); });
}

}  // namespace vesk
