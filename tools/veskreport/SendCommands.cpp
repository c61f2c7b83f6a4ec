#include <condition_variable>
#include <mutex>

#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/MessageFate.h"
#include "tools/veskreport/PayloadParser.h"
#include "tools/veskreport/Terminal.h"

namespace vesk {

namespace {

// Enough to keep the daemon busy, and far below the limit of the session's queue.
constexpr std::size_t kMaximumUnderway = 256;

Dictionary parametersOf(const Invocation& invocation, const std::optional<Dictionary>& payload) {
  MutableDictionary parameters;
  parameters.append(kVeskReportingMessageParametersCategory, int{*invocation.category});
  parameters.append(kVeskReportingMessageParametersType, int{*invocation.type});
  if (payload) parameters.append(kVeskReportingMessageParametersPayload, *payload);
  parameters.append(kVeskReportingMessageParametersFlag, invocation.flag);
  return parameters.share();
}

std::optional<Dictionary> payloadOf(const Invocation& invocation, const Output& output) {
  if (invocation.payload.empty()) return std::nullopt;
  auto pairs = parsePairs(invocation.payload);
  if (!pairs) output.fail(pairs.error().text, kExitUsage);
  return *std::move(pairs);
}

/// Sends each line of standard input as a message, many of them concurrently, and reports each outcome.
/// Reports and skips invalid lines.
class MessageStream {
 public:
  MessageStream(DaemonSession& session, const Invocation& invocation, const Output& output)
      : _session(session), _invocation(invocation), _output(output) {}

  /// Runs until the end of standard input. Returns the exit status.
  int run() {
    while (auto line = _lines.next()) {
      auto message = messageIn(*line);
      message ? send(_lines.number(), *std::move(message)) : failed(_lines.number(), message.error().text);
      _progress.show(_lines.number(), _lines.bytes());
    }
    waitUntilAtMost(0);
    _progress.clear();
    return finish();
  }

 private:
  /// If the command line gives category and type, the line is a payload, otherwise a whole message.
  Result<Dictionary> messageIn(const std::string& line) const {
    auto parsed = parsePayloadObject(line);
    if (!parsed) return parsed;
    if (_invocation.category) return parametersOf(_invocation, *parsed);
    const Value* payload = parsed->find(kVeskReportingMessageParametersPayload);
    if (payload && !payload->dictionary()) return malformed("\"payload\" is no object");
    for (const char* key : {kVeskReportingMessageParametersType, kVeskReportingMessageParametersCategory}) {
      auto number = integerForKey(*parsed, key);
      if (!number || *number < 0 || *number > 65535)
        return malformed("\"" + std::string(key) + "\" is no number from 0 to 65535");
    }
    if (parsed->contains(kVeskReportingMessageParametersFlag)) return parsed;
    MutableDictionary parameters(*parsed, 1);
    parameters.append(kVeskReportingMessageParametersFlag, _invocation.flag);
    return parameters.share();
  }

  void send(std::uint64_t line, Dictionary parameters) {
    waitUntilAtMost(kMaximumUnderway - 1);
    {
      std::lock_guard lock(_mutex);
      ++_underway;
    }
    auto callback = [this, line](const ReportingResult<MessageAnswer>& result) { ended(line, result); };
    auto status = _session->sendMessage(std::move(parameters), callback, _invocation.timeout);
    if (status != ReportingStatus::Queued) ended(line, {status, {}, {}});
  }

  /// Called on the session's thread, too.
  void ended(std::uint64_t line, const ReportingResult<MessageAnswer>& result) {
    if (!result) {
      failed(line, causeOf(result.status, result.detail));
    } else if (_output.isJSON()) {
      _output.done("", {{"line", line}, {"answer", result.answer ? Value(*result.answer) : Value()}});
    }
    std::lock_guard lock(_mutex);
    if (result) ++_sent;
    --_underway;
    _hasEnded.notify_one();
  }

  void failed(std::uint64_t line, const std::string& cause) {
    _progress.clear();
    _output.failed("line " + std::to_string(line) + ": " + cause, {{"line", line}});
    std::lock_guard lock(_mutex);
    ++_failed;
  }

  void waitUntilAtMost(std::size_t messages) {
    std::unique_lock lock(_mutex);
    _hasEnded.wait(lock, [&] { return _underway <= messages; });
  }

  int finish() {
    std::lock_guard lock(_mutex);
    const auto drops = _watch.drops();
    if (!_lines.error().empty()) return _output.failed("standard input: " + _lines.error());
    std::string words = std::to_string(_sent) + (_sent == 1 ? " message sent" : " messages sent");
    if (_failed > 0) words += ", " + std::to_string(_failed) + " failed";
    if (drops.count > 0) words += ", " + std::to_string(drops.count) + " dropped (" + drops.cause + ")";
    const int told = _output.done(words, {{"sent", _sent}, {"failed", _failed}, {"dropped", drops.count}});
    return _failed == 0 && drops.count == 0 ? told : kExitFailed;
  }

  DaemonSession& _session;
  const Invocation& _invocation;
  const Output& _output;
  MessageWatch _watch{_invocation, _output, _session.sessionInfo(), "dropped", false};
  LineReader _lines;
  Progress _progress{STDIN_FILENO};

  // Shared with the session's thread.
  std::mutex _mutex;
  std::condition_variable _hasEnded;
  std::size_t _underway = 0;
  std::uint64_t _sent = 0;
  std::uint64_t _failed = 0;
};

}  // namespace

int runSend(const Invocation& invocation, const Output& output) {
  const auto payload = payloadOf(invocation, output);
  DaemonSession session(invocation, output);
  if (invocation.fromStandardInput) {
    session.start();
    return MessageStream(session, invocation, output).run();
  }
  MessageWatch watch(invocation, output, session.sessionInfo());
  session.start();
  Dictionary parameters = parametersOf(invocation, payload);
  const auto timeout = invocation.timeout;
  if (invocation.noWait) {
    auto status = session->sendMessage(parameters);
    if (status != ReportingStatus::Queued) session.fail(status);
    // Calls keep their order. The answer to this one shows that the message was sent or failed.
    auto next = session->fetchDisplayURL(timeout);
    if (session->drops().invalid > 0) session.fail(ReportingStatus::InvalidArgument);
    session.answerOf(next);
    return reportFates(watch.fates(*invocation.category, *invocation.type), std::nullopt, output);
  }
  const auto answer = session.answerOf(session->sendMessageAndWait(parameters, timeout));
  return reportFates(watch.fates(*invocation.category, *invocation.type), answer, output);
}

int runSendOnce(const Invocation& invocation, const Output& output) {
  const auto payload = payloadOf(invocation, output);
  DaemonSession session(invocation, output);
  MessageWatch watch(invocation, output, session.sessionInfo());
  std::string answer = session.answerOf(
      session->sendMessageOnceAndWait(session.sessionInfo(), session.userInfo(), *invocation.category,
                                      *invocation.type, payload, invocation.timeout));
  if (answer != "finished") return output.failed(answer);
  return reportFates(watch.fates(*invocation.category, *invocation.type), answer, output);
}

}  // namespace vesk
