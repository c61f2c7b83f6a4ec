#include "tools/veskreport/SendCommands.h"

#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/MessageStream.h"
#include "tools/veskreport/PayloadParser.h"

namespace vesk {

namespace {

Dictionary parametersOf(const MessageArguments& message, const std::optional<Dictionary>& payload) {
  MutableDictionary parameters;
  parameters.append(kVeskReportingMessageParametersCategory, int{*message.category});
  parameters.append(kVeskReportingMessageParametersType, int{*message.type});
  if (payload) parameters.append(kVeskReportingMessageParametersPayload, *payload);
  parameters.append(kVeskReportingMessageParametersFlag, message.flag);
  return parameters.share();
}

// Returns kExitUsage and reports the reason if the arguments are not a payload.
int payloadOf(const MessageArguments& message, const Output& output, std::optional<Dictionary>& payload) {
  if (message.payload.empty()) return kExitDone;
  auto pairs = parsePairs(message.payload);
  if (!pairs) {
    output.failed(pairs.error().text);
    return kExitUsage;
  }
  payload = *std::move(pairs);
  return kExitDone;
}

int sendFromStandardInput(const Invocation& invocation, const Output& output) {
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  return MessageStream(session, invocation.message, invocation.identity.timeout, output).run();
}

}  // namespace

int runSend(const Invocation& invocation, const Output& output) {
  const MessageArguments& message = invocation.message;
  if (message.fromStandardInput) return sendFromStandardInput(invocation, output);

  std::optional<Dictionary> payload;
  if (int status = payloadOf(message, output, payload)) return status;
  DaemonSession session(invocation.identity, output);
  if (int status = session.start()) return status;
  if (session.backends().empty() && !output.isJSON()) output.note("no backend is enabled for this session");
  Dictionary parameters = parametersOf(message, payload);
  if (message.noWait) {
    auto status = session.reporting().sendMessage(parameters);
    if (status != ReportingStatus::Queued) return session.failed(status, "");
    // Calls keep their order. The answer to this one shows that the message was sent or failed.
    auto next = session.reporting().fetchDisplayURL(invocation.identity.timeout);
    if (session.reporting().drops().invalid > 0) return session.failed(ReportingStatus::InvalidArgument, "");
    if (!next) return session.failed(next);
    return output.done("sent", {{"answer", Value()}});
  }
  auto sent = session.reporting().sendMessageAndWait(parameters, invocation.identity.timeout);
  if (!sent) return session.failed(sent);
  return output.done(sent.answer.value_or("accepted"),
                     {{"answer", sent.answer ? Value(*sent.answer) : Value()}});
}

int runSendOnce(const Invocation& invocation, const Output& output) {
  const MessageArguments& message = invocation.message;
  std::optional<Dictionary> payload;
  if (int status = payloadOf(message, output, payload)) return status;
  DaemonSession session(invocation.identity, output);
  if (int status = session.connect()) return status;
  auto sent =
      session.reporting().sendMessageOnceAndWait(session.sessionInfo(), session.userInfo(), *message.category,
                                                 *message.type, payload, invocation.identity.timeout);
  if (!sent) return session.failed(sent);
  if (sent.answer != "finished") return output.failed(sent.answer);
  return output.done(sent.answer, {{"answer", sent.answer}});
}

}  // namespace vesk
