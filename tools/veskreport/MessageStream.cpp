#include "tools/veskreport/MessageStream.h"

#include <unistd.h>

#include "tools/veskreport/PayloadParser.h"

namespace vesk {

namespace {

// Enough to keep the daemon busy, and far below the limit of the session's queue.
constexpr std::size_t kMaximumUnderway = 256;

}  // namespace

MessageStream::MessageStream(DaemonSession& session, const MessageArguments& arguments,
                             std::chrono::milliseconds timeout, const Output& output)
    : _session(session),
      _arguments(arguments),
      _timeout(timeout),
      _output(output),
      _lines(STDIN_FILENO),
      _progress(STDIN_FILENO) {}

int MessageStream::run() {
  while (auto line = _lines.next()) {
    if (auto parameters = parametersOf(*line)) {
      send(_lines.number(), *std::move(parameters));
    } else {
      failed(_lines.number(), parameters.error().text);
    }
    _progress.show(_lines.number(), _lines.bytes());
  }
  waitUntilAtMost(0);
  _progress.clear();
  return finish();
}

// If the command line gives category and type, the line is a payload, otherwise a whole message.
Result<Dictionary> MessageStream::parametersOf(const std::string& line) const {
  auto parsed = parsePayloadObject(line);
  if (!parsed) return parsed;
  MutableDictionary parameters;
  if (_arguments.category) {
    parameters.append(kVeskReportingMessageParametersCategory, int{*_arguments.category});
    parameters.append(kVeskReportingMessageParametersType, int{*_arguments.type});
    parameters.append(kVeskReportingMessageParametersPayload, *parsed);
  } else {
    const Value* payload = parsed->find(kVeskReportingMessageParametersPayload);
    if (payload && !payload->dictionary()) return malformed("\"payload\" is no object");
    for (const char* key : {kVeskReportingMessageParametersType, kVeskReportingMessageParametersCategory}) {
      auto number = integerForKey(*parsed, key);
      if (!number || *number < 0 || *number > 65535)
        return malformed("\"" + std::string(key) + "\" is no number from 0 to 65535");
    }
    parameters.setAll(*parsed);
  }
  if (!parameters.contains(kVeskReportingMessageParametersFlag)) {
    parameters.append(kVeskReportingMessageParametersFlag, _arguments.flag);
  }
  return parameters.share();
}

void MessageStream::send(std::uint64_t line, Dictionary parameters) {
  waitUntilAtMost(kMaximumUnderway - 1);
  {
    std::lock_guard lock(_mutex);
    ++_underway;
  }
  auto callback = [this, line](const ReportingResult<MessageAnswer>& result) { ended(line, result); };
  auto status = _session.reporting().sendMessage(std::move(parameters), callback, _timeout);
  if (status != ReportingStatus::Queued) ended(line, {status, {}, {}});
}

void MessageStream::ended(std::uint64_t line, const ReportingResult<MessageAnswer>& result) {
  if (!result) {
    std::string cause = describe(result.status);
    failed(line, result.detail.empty() ? cause : cause + ": " + result.detail);
  } else if (_output.isJSON()) {
    _output.done("", {{"line", line}, {"answer", result.answer ? Value(*result.answer) : Value()}});
  }
  std::lock_guard lock(_mutex);
  if (result) ++_sent;
  --_underway;
  _hasEnded.notify_one();
}

void MessageStream::failed(std::uint64_t line, const std::string& cause) {
  _progress.clear();
  _output.failed("line " + std::to_string(line) + ": " + cause, {{"line", line}});
  std::lock_guard lock(_mutex);
  ++_failed;
}

void MessageStream::waitUntilAtMost(std::size_t messages) {
  std::unique_lock lock(_mutex);
  _hasEnded.wait(lock, [&] { return _underway <= messages; });
}

int MessageStream::finish() {
  std::lock_guard lock(_mutex);
  if (!_lines.error().empty()) return _output.failed("standard input: " + _lines.error());
  std::string words = std::to_string(_sent) + (_sent == 1 ? " message sent" : " messages sent");
  if (_failed > 0) words += ", " + std::to_string(_failed) + " failed";
  const int told = _output.done(words, {{"sent", _sent}, {"failed", _failed}});
  return _failed == 0 ? told : kExitFailed;
}

}  // namespace vesk
