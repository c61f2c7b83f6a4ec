// The tool's session with the daemon.
#pragma once

#include <VeskReporting/VeskReporting.h>

#include <optional>
#include <string>

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// A session with the identity from the command line.
class DaemonSession {
 public:
  DaemonSession(const ClientIdentity& identity, const Output& output);

  /// These return kExitDone, or the exit status of a failure that they have reported.
  [[nodiscard]] int connect();
  /// Connects, configures and starts the session, as an aggregating client if there is a handler. The handler
  /// must outlive this object.
  [[nodiscard]] int start(AggregationHandler aggregation = nullptr);

  VeskReporting& reporting() { return *_reporting; }
  const Dictionary& sessionInfo() const { return _sessionInfo; }
  const std::optional<Dictionary>& userInfo() const { return _userInfo; }
  /// The enabled backends; empty before `start`.
  const BackendNames& backends() const { return _backends; }

  /// Reports a failed call.
  template <class Answer>
  int failed(const ReportingResult<Answer>& result) const {
    return failed(result.status, result.detail);
  }
  int failed(ReportingStatus status, const std::string& detail) const;

 private:
  int makeUserInfo();

  const ClientIdentity& _identity;
  const Output& _output;
  std::string _socketPath;
  std::optional<VeskReporting> _reporting;
  Dictionary _sessionInfo;
  std::optional<Dictionary> _userInfo;
  BackendNames _backends;
};

}  // namespace vesk
