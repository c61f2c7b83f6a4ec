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

Dictionary sessionInfoOf(const ClientIdentity& identity) {
  return {
      {kVeskReportingSessionInfoSessionID, identity.sessionID != 0 ? identity.sessionID : randomSessionID()},
      {kVeskReportingSessionInfoClientType, identity.clientType},
      {kVeskReportingSessionInfoClientVersion, int{identity.clientVersion}},
      {kVeskReportingSessionInfoRequireUserInfo, identity.requireUserInfo},
      {kVeskReportingSessionInfoBatchEvent, identity.batch}};
}

}  // namespace

DaemonSession::DaemonSession(const ClientIdentity& identity, const Output& output)
    : _identity(identity),
      _output(output),
      _socketPath(identity.socket.empty() ? pathUnderRoot(wire::kSocketPath) : identity.socket),
      _sessionInfo(sessionInfoOf(identity)) {}

int DaemonSession::makeUserInfo() {
  auto further = parsePairs(_identity.userInfo);
  if (!further) {
    _output.failed("user info " + further.error().text);
    return kExitUsage;
  }
  MutableDictionary userInfo;
  if (!_identity.clientName.empty()) userInfo.set(kVeskReportingUserInfoClientName, _identity.clientName);
  if (!_identity.serviceName.empty()) userInfo.set(kVeskReportingUserInfoServiceName, _identity.serviceName);
  userInfo.setAll(*further);
  if (!userInfo.empty()) _userInfo = userInfo.share();
  return kExitDone;
}

int DaemonSession::connect() {
  if (int status = makeUserInfo()) return status;
  ReportingOptions options;
  options.socketPath = _socketPath;
  options.drainTime = _identity.timeout;
  _reporting.emplace(options);
  auto connected = _reporting->connect(_identity.timeout);
  if (connected) return kExitDone;
  if (connected.status != ReportingStatus::NotConnected) return failed(connected);
  std::string cause = connected.detail;
  if (cause.starts_with(_socketPath + ": ")) cause.erase(0, _socketPath.size() + 2);
  return _output.failed("no daemon at " + _socketPath + ": is veskreportingd running? (" + cause + ")");
}

int DaemonSession::start(AggregationHandler aggregation) {
  if (int status = connect()) return status;
  auto configured = _reporting->setSessionInfo(_sessionInfo, _userInfo, {}, std::move(aggregation));
  if (configured != ReportingStatus::Queued) return failed(configured, "");
  auto started = _reporting->startConfig(_identity.timeout);
  if (!started) return failed(started);
  if (!started.answer) {
    return _output.failed("the daemon has no storebag for client type " +
                          std::to_string(_identity.clientType) + " (its log says why)");
  }
  _backends = std::move(*started.answer);
  return kExitDone;
}

int DaemonSession::failed(ReportingStatus status, const std::string& detail) const {
  std::string cause = describe(status);
  return _output.failed(detail.empty() ? cause : cause + ": " + detail);
}

}  // namespace vesk
