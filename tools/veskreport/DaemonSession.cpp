#include "tools/veskreport/DaemonSession.h"

#include <random>

#include "platform/files/RootPrefix.h"
#include "protocol/WireNames.h"
#include "tools/veskreport/PayloadParser.h"

namespace vesk {

namespace {

std::uint32_t randomSessionID() {
  // Below 2^31 because display URLs show it as a signed number.
  std::uniform_int_distribution<std::uint32_t> anyButNone(1, 0x7fffffff);
  std::random_device device;
  return anyButNone(device);
}

Dictionary sessionInfoOf(const Invocation& invocation) {
  return {{kVeskReportingSessionInfoSessionID,
           invocation.sessionID != 0 ? invocation.sessionID : randomSessionID()},
          {kVeskReportingSessionInfoClientType, invocation.clientType},
          {kVeskReportingSessionInfoClientVersion, int{invocation.clientVersion}},
          {kVeskReportingSessionInfoRequireUserInfo, invocation.requireUserInfo},
          {kVeskReportingSessionInfoBatchEvent, invocation.batch}};
}

}  // namespace

std::optional<Dictionary> userInfoOf(const Invocation& invocation, const Output& output) {
  auto further = parsePairs(invocation.userInfo);
  if (!further) output.fail("user info " + further.error().text, kExitUsage);
  MutableDictionary userInfo;
  if (!invocation.clientName.empty()) userInfo.set(kVeskReportingUserInfoClientName, invocation.clientName);
  if (!invocation.serviceName.empty())
    userInfo.set(kVeskReportingUserInfoServiceName, invocation.serviceName);
  userInfo.setAll(*further);
  if (userInfo.empty()) return std::nullopt;
  return userInfo.share();
}

DaemonSession::DaemonSession(const Invocation& invocation, const Output& output)
    : _invocation(invocation), _output(output), _sessionInfo(sessionInfoOf(_invocation)) {
  _userInfo = userInfoOf(_invocation, _output);
  if (!_invocation.requireUserInfo)
    _output.note(
        "without required user info the daemon asks neither consent, client entry, region, sampling "
        "nor filters");
  const std::string path = _invocation.socket.empty() ? pathUnderRoot(wire::kSocketPath) : _invocation.socket;
  ReportingOptions options;
  options.socketPath = path;
  options.drainTime = _invocation.timeout;
  _reporting.emplace(options);
  auto connected = _reporting->connect(_invocation.timeout);
  if (connected.status == ReportingStatus::NotConnected) {
    std::string cause = connected.detail;
    if (cause.starts_with(path + ": ")) cause.erase(0, path.size() + 2);
    _output.fail("no daemon at " + path + ": is veskreportingd running? (" + cause + ")");
  }
  answerOf(connected);
}

BackendNames DaemonSession::start(AggregationHandler aggregation) {
  auto configured = _reporting->setSessionInfo(_sessionInfo, _userInfo, {}, std::move(aggregation));
  if (configured != ReportingStatus::Queued) fail(configured);
  auto backends = answerOf(_reporting->startConfig(_invocation.timeout));
  if (!backends)
    _output.fail("the daemon has no storebag for client type " + std::to_string(_invocation.clientType) +
                 " (its log says why)");
  return *std::move(backends);
}

void DaemonSession::fail(ReportingStatus status, const std::string& detail) const {
  _output.fail(causeOf(status, detail));
}

std::string causeOf(ReportingStatus status, const std::string& detail) {
  std::string cause = describe(status);
  return detail.empty() ? cause : cause + ": " + detail;
}

}  // namespace vesk
