#include "protocol/ClientSessionStub.h"

#include <cstddef>
#include <optional>
#include <string>
#include <tuple>
#include <type_traits>
#include <utility>

#include "SessionIntrospection.h"
#include "protocol/WireNames.h"

namespace vesk {

static_assert(kMaxAnswerBytes <= CodecLimits{}.content);

namespace {

using Session = ClientSessionInterface;

template <class... Answers>
void takeReply(IPCIncomingCall& call, Reply<Answers...>& reply) {
  reply = call.takeReply<Answers...>();
}

template <class... Parameters>
void serveWith(void (Session::*method)(Parameters...), Session& session, const char* signature,
               IPCIncomingCall& call) {
  constexpr std::size_t kReply = sizeof...(Parameters) - 1;
  std::tuple<std::decay_t<Parameters>...> values;
  const auto read = [&]<std::size_t... index>(std::index_sequence<index...>) {
    return call.read(signature, std::get<index>(values)...);
  };
  if (!read(std::make_index_sequence<kReply>())) return;
  takeReply(call, std::get<kReply>(values));
  std::apply([&](auto&... value) { (session.*method)(std::forward<Parameters>(value)...); }, values);
}

/// Reads the arguments of `method` and calls it. Its last parameter is the reply.
template <auto method>
void serve(Session& session, const char* signature, IPCIncomingCall& call) {
  serveWith(method, session, signature, call);
}

void setSessionInfo(Session& session, const char* signature, IPCIncomingCall& call) {
  Dictionary sessionInfo;
  std::optional<Dictionary> userInfo;
  List frameworksToCheck;
  bool hasAggregationBlock = false;
  if (!call.read(signature, sessionInfo, userInfo, frameworksToCheck, hasAggregationBlock)) return;
  session.setSessionInfo(sessionInfo, userInfo, frameworksToCheck, hasAggregationBlock);
  call.answer();
}

void uploadFileAtPath(Session& session, const char* signature, IPCIncomingCall& call) {
  std::string fileURL;
  FileDescriptor descriptor;
  if (!call.read(signature, fileURL, descriptor)) return;
  std::string extensionToken = descriptor ? call.grant(std::move(descriptor)) : std::string();
  session.uploadFileAtPath(fileURL, extensionToken, call.takeReply<bool>());
}

struct Handler {
  const wire::Member& member;
  void (*handle)(Session& session, const char* signature, IPCIncomingCall& call);
};

// Ordered by frequency.
constexpr Handler kHandlers[] = {
    {wire::kSendMessageWithDictionary, serve<&Session::sendMessageWithDictionary>},
    {wire::kSendMessageWithCategory, serve<&Session::sendMessageWithCategory>},
    {wire::kSendMessageWithSessionInfo, serve<&Session::sendMessageWithSessionInfo>},
    {wire::kFlushMessages, serve<&Session::flushMessagesWithReply>},
    {wire::kSetSessionInfo, setSessionInfo},
    {wire::kStartConfig, serve<&Session::startConfigWithCompletionHandler>},
    {wire::kFetchStates, serve<&Session::fetchStatesWithUserInfo>},
    {wire::kFetchDisplayURL, serve<&Session::fetchDisplayURL>},
    {wire::kUploadFile, uploadFileAtPath},
    {wire::kUploadLogData, serve<&Session::uploadLogData>},
};

}  // namespace

const char* ClientSessionStub::interfaceName() const { return wire::kSessionInterface; }

const char* ClientSessionStub::introspection() const { return kSessionIntrospection; }

void ClientSessionStub::handle(IPCIncomingCall& call) {
  for (const auto& [member, handle] : kHandlers) {
    if (call.member() == member.name) return handle(*_session, member.arguments, call);
  }
  call.refuse("org.freedesktop.DBus.Error.UnknownMethod", "The interface has no such method");
}

}  // namespace vesk
