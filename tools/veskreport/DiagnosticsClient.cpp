#include "tools/veskreport/DiagnosticsClient.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <poll.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <system_error>

#include "platform/files/RootPrefix.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/PayloadParser.h"

namespace vesk {

DiagnosticsClient::DiagnosticsClient(const Invocation& invocation, const Output& output)
    : _invocation(invocation), _output(output) {
  const std::string path = invocation.socket.empty() ? pathUnderRoot(wire::kSocketPath) : invocation.socket;
  try {
    BusClient::Options options;
    options.socketPath = path;
    options.objectPath = wire::kDiagnosticsPath;
    _bus = std::make_unique<BusClient>(std::move(options));
  } catch (const std::system_error& error) {
    output.fail("no daemon at " + path + ": is veskreportingd running? (" +
                std::strerror(error.code().value()) + ")");
  }
}

Dictionary DiagnosticsClient::ask(const wire::Member& member, std::vector<IPCArgument> arguments) {
  auto answer = call(member, std::move(arguments));
  if (!answer) _output.fail("the daemon does not tell: " + answer.error().text);
  return *std::move(answer);
}

Result<Dictionary> DiagnosticsClient::call(const wire::Member& member, std::vector<IPCArgument> arguments) {
  std::optional<Dictionary> result;
  std::string problem;
  const auto onAnswer = [&](BusAnswer& answer) {
    Dictionary value;
    if (answer.read(value)) {
      result = std::move(value);
    } else {
      problem = answer.errorText().empty() ? "its answer is of another type" : answer.errorText();
    }
  };
  const auto sent =
      _bus->send(IPCOutgoingCall{wire::kDiagnosticsInterface, member.name, std::move(arguments)}, onAnswer,
                 _invocation.timeout);
  if (sent != BusClient::SendResult::Sent) return malformed("the request can not be sent");
  while (!result && problem.empty()) {
    pollfd source{_bus->fd(), _bus->events(), 0};
    ::poll(&source, 1, _bus->timeout());
    if (_bus->process() == BusClient::Progress::Disconnected && !result && problem.empty())
      problem = "the daemon has closed the connection";
  }
  if (!result) return malformed(problem);
  return *std::move(result);
}

Dictionary explanationRequest(const Invocation& invocation, const Output& output) {
  MutableDictionary request(Dictionary{{kVeskReportingSessionInfoClientType, invocation.clientType},
                                       {kVeskReportingSessionInfoRequireUserInfo, invocation.requireUserInfo},
                                       {"draw", invocation.draw}});
  if (const auto userInfo = userInfoOf(invocation, output)) request.set("userInfo", *userInfo);
  if (!invocation.payload.empty()) {
    auto payload = parsePairs(invocation.payload);
    if (!payload) output.fail(payload.error().text, kExitUsage);
    request.set("payload", *std::move(payload));
    request.set("category", int{invocation.category.value_or(1)});
    request.set("type", int{invocation.type.value_or(0)});
  }
  if (const auto device = explainedDevice(invocation)) {
    for (const auto& [key, value] : *device) {
      constexpr std::string_view kKnown[] = {"DeviceName", "RegionCode", "diagnosticsSubmission"};
      if (invocation.authoring.storebag.empty() && std::ranges::find(kKnown, key.view()) == std::end(kKnown))
        output.fail("--device: the daemon decides with its own " + printable(key.view()) +
                        "; only with --storebag it can be another",
                    kExitUsage);
    }
    request.set("device", *device);
  }
  return request.share();
}

std::string textIn(const Dictionary& from, const char* key) {
  const Value* value = from.find(key);
  if (value == nullptr || value->isNone()) return "";
  return printable(value->text() ? value->text()->string() : describe(*value));
}

Dictionary dictionaryIn(const Dictionary& from, const char* key) {
  return from.dictionary(key).value_or(Dictionary());
}

std::vector<Dictionary> listIn(const Dictionary& from, const char* key) {
  std::vector<Dictionary> all;
  const Value* value = from.find(key);
  const List* list = value ? value->list() : nullptr;
  for (std::size_t i = 0; list && i < list->size(); ++i) {
    if (const Dictionary* each = (*list)[i].dictionary()) all.push_back(*each);
  }
  return all;
}

std::string durationIn(const Dictionary& from, const char* key) {
  const Value* seconds = from.find(key);
  const double all = seconds ? std::max(0.0, seconds->asDouble().value_or(0)) : 0;
  const auto whole = [](double number, const char* unit) {
    return std::to_string(std::llround(number)) + unit;
  };
  if (all < 120) return whole(all, " s");
  if (all < 7200) return whole(all / 60, " min");
  if (all < 172'800) return whole(all / 3600, " h");
  return whole(all / 86'400, " d");
}

}  // namespace vesk
