// Asks the daemon's diagnostics object.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/ipc/BusClient.h"
#include "platform/result/Result.h"
#include "protocol/WireNames.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/Output.h"

namespace vesk {

class DiagnosticsClient {
 public:
  /// Connects. Without a daemon, that is reported and ends the command.
  DiagnosticsClient(const Invocation& invocation, const Output& output);

  /// Waits for the answer. A failure is reported and ends the command.
  Dictionary ask(const wire::Member& member, std::vector<IPCArgument> arguments = {});
  /// The same, but a failure is the caller's.
  Result<Dictionary> call(const wire::Member& member, std::vector<IPCArgument> arguments = {});

 private:
  const Invocation& _invocation;
  const Output& _output;
  std::unique_ptr<BusClient> _bus;
};

/// What the command line asks `explain` for. Ends the command if the user info is malformed.
Dictionary explanationRequest(const Invocation& invocation, const Output& output);

// The parts of an answer; empty if they are missing or of another type.

/// In a form that can be printed.
std::string textIn(const Dictionary& from, const char* key);
Dictionary dictionaryIn(const Dictionary& from, const char* key);
std::vector<Dictionary> listIn(const Dictionary& from, const char* key);
/// A number of seconds as "45 s", "12 min", "3 h" or "2 d".
std::string durationIn(const Dictionary& from, const char* key);

/// Seconds since 1970 as "18:42:07.123", in UTC.
std::string clockIn(const Dictionary& from, const char* key);

/// A record, as `tap` prints it.
std::string tapLine(const Dictionary& record);
/// The daemon's status, as `status` prints it.
std::vector<std::string> statusLines(const Dictionary& status);

}  // namespace vesk
