// The tool's session with the daemon.
#pragma once

#include <VeskReporting/VeskReporting.h>

#include <optional>
#include <string>

#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// A session with the identity from the command line. Every failure is reported and ends the command.
class DaemonSession {
 public:
  /// Connects to the daemon.
  DaemonSession(const Invocation& invocation, const Output& output);

  /// Configures and starts the session, as an aggregating client if there is a handler, which must outlive
  /// this object. Returns the enabled backends.
  BackendNames start(AggregationHandler aggregation = nullptr);

  VeskReporting* operator->() { return &*_reporting; }
  const Dictionary& sessionInfo() const { return _sessionInfo; }
  const std::optional<Dictionary>& userInfo() const { return _userInfo; }

  template <class Answer>
  Answer answerOf(ReportingResult<Answer> result) const {
    if (!result) fail(result.status, result.detail);
    return std::move(result.answer);
  }
  [[noreturn]] void fail(ReportingStatus status, const std::string& detail = {}) const;

 private:
  const Invocation& _invocation;
  const Output& _output;
  std::optional<VeskReporting> _reporting;
  Dictionary _sessionInfo;
  std::optional<Dictionary> _userInfo;
};

/// The user info that the command line gives; nullopt if it gives none. Ends the command if it is malformed.
std::optional<Dictionary> userInfoOf(const Invocation& invocation, const Output& output);

/// Why a call failed, in words.
std::string causeOf(ReportingStatus status, const std::string& detail);

}  // namespace vesk
