#include "client/protocol/ClientSessionStub.h"

#include "SessionIntrospection.h"
#include "client/protocol/WireNames.h"

namespace vesk {

static_assert(kMaxAnswerBytes <= CodecLimits{}.content);

struct ClientSessionStub::Handler {
  const wire::Member& member;
  void (ClientSessionStub::*handle)(IPCIncomingCall& call);
};

// The most frequent first.
const ClientSessionStub::Handler ClientSessionStub::kHandlers[] = {
    {wire::kSendMessageWithDictionary, &ClientSessionStub::sendMessageWithDictionary},
    {wire::kSendMessageWithCategory, &ClientSessionStub::sendMessageWithCategory},
    {wire::kSendMessageWithSessionInfo, &ClientSessionStub::sendMessageWithSessionInfo},
    {wire::kFlushMessages, &ClientSessionStub::flushMessagesWithReply},
    {wire::kSetSessionInfo, &ClientSessionStub::setSessionInfo},
    {wire::kStartConfig, &ClientSessionStub::startConfigWithCompletionHandler},
    {wire::kFetchStates, &ClientSessionStub::fetchStatesWithUserInfo},
    {wire::kFetchDisplayURL, &ClientSessionStub::fetchDisplayURL},
    {wire::kUploadFile, &ClientSessionStub::uploadFileAtPath},
    {wire::kUploadLogData, &ClientSessionStub::uploadLogData},
};

const char* ClientSessionStub::interfaceName() const { return wire::kSessionInterface; }

const char* ClientSessionStub::introspection() const { return kSessionIntrospection; }

void ClientSessionStub::handle(IPCIncomingCall& call) {
  for (const auto& handler : kHandlers) {
    if (call.member() == handler.member.name) return (this->*handler.handle)(call);
  }
  call.refuse("org.freedesktop.DBus.Error.UnknownMethod", "The interface has no such method");
}

void ClientSessionStub::setSessionInfo(IPCIncomingCall& call) {
  Dictionary sessionInfo;
  std::optional<Dictionary> userInfo;
  List frameworksToCheck;
  bool hasAggregationBlock = false;
  if (!call.read(wire::kSetSessionInfo.arguments, sessionInfo, userInfo, frameworksToCheck,
                 hasAggregationBlock)) {
    return;
  }
  _session->setSessionInfo(sessionInfo, userInfo, frameworksToCheck, hasAggregationBlock);
  call.answer();
}

void ClientSessionStub::startConfigWithCompletionHandler(IPCIncomingCall& call) {
  if (!call.read(wire::kStartConfig.arguments)) return;
  _session->startConfigWithCompletionHandler(call.takeReply<std::optional<BackendNames>>());
}

void ClientSessionStub::fetchStatesWithUserInfo(IPCIncomingCall& call) {
  std::optional<Dictionary> userInfo;
  if (!call.read(wire::kFetchStates.arguments, userInfo)) return;
  _session->fetchStatesWithUserInfo(userInfo, call.takeReply<std::optional<BackendNames>>());
}

void ClientSessionStub::fetchDisplayURL(IPCIncomingCall& call) {
  if (!call.read(wire::kFetchDisplayURL.arguments)) return;
  _session->fetchDisplayURL(call.takeReply<std::string>());
}

void ClientSessionStub::sendMessageWithCategory(IPCIncomingCall& call) {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
  if (!call.read(wire::kSendMessageWithCategory.arguments, category, type, payload)) return;
  _session->sendMessageWithCategory(category, type, payload, call.takeReply<std::optional<std::string>>());
}

void ClientSessionStub::sendMessageWithDictionary(IPCIncomingCall& call) {
  Dictionary parameters;
  if (!call.read(wire::kSendMessageWithDictionary.arguments, parameters)) return;
  _session->sendMessageWithDictionary(parameters, call.takeReply<std::optional<std::string>>());
}

void ClientSessionStub::flushMessagesWithReply(IPCIncomingCall& call) {
  if (!call.read(wire::kFlushMessages.arguments)) return;
  _session->flushMessagesWithReply(call.takeReply<std::optional<std::string>>());
}

void ClientSessionStub::uploadFileAtPath(IPCIncomingCall& call) {
  std::string fileURL;
  FileDescriptor descriptor;
  if (!call.read(wire::kUploadFile.arguments, fileURL, descriptor)) return;
  std::string extensionToken = descriptor ? call.grant(std::move(descriptor)) : std::string();
  _session->uploadFileAtPath(fileURL, extensionToken, call.takeReply<bool>());
}

void ClientSessionStub::uploadLogData(IPCIncomingCall& call) {
  List logData;
  if (!call.read(wire::kUploadLogData.arguments, logData)) return;
  _session->uploadLogData(logData, call.takeReply<bool, std::optional<std::string>>());
}

void ClientSessionStub::sendMessageWithSessionInfo(IPCIncomingCall& call) {
  Dictionary sessionInfo;
  std::optional<Dictionary> userInfo;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
  if (!call.read(wire::kSendMessageWithSessionInfo.arguments, sessionInfo, userInfo, category, type,
                 payload)) {
    return;
  }
  _session->sendMessageWithSessionInfo(sessionInfo, userInfo, category, type, payload,
                                       call.takeReply<std::string>());
}

}  // namespace vesk
