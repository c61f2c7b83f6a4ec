// The command line, and the commands that it names.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/veskreport/Output.h"
#include "tools/veskreport/StorebagAuthoring.h"

namespace vesk {

/// The parsed command line.
struct Invocation {
  int (*command)(const Invocation& invocation, const Output& output) = nullptr;
  bool json = false;
  std::string root;

  // How the tool identifies itself to the daemon.
  std::string socket;
  std::int32_t clientType = 0;
  std::uint16_t clientVersion = 1;
  std::uint32_t sessionID = 0;
  std::string clientName;
  std::string serviceName;
  std::vector<std::string> userInfo;  ///< other key=text and key:=json pairs
  bool requireUserInfo = true;
  bool start = false;  ///< a session, to ask for its states
  bool batch = false;
  std::chrono::milliseconds timeout{30'000};

  std::optional<std::uint16_t> category;
  std::optional<std::uint16_t> type;
  std::uint32_t flag = 0;
  std::vector<std::string> payload;  ///< key=text and key:=json pairs
  bool noWait = false;
  bool fromStandardInput = false;  ///< messages or log data, one a line

  std::uint64_t aggregateCount = 0;  ///< messages to wait for; 0: unlimited
  std::string upload;                ///< path of the file
  std::vector<std::string> logData;  ///< one text each
  std::string since;                 ///< a time, or an age such as "90m"; empty: from the beginning

  std::string keptRoot;              ///< of dev; empty: a temporary one
  std::vector<std::string> program;  ///< that dev runs, with its arguments; empty: none

  bool openMetrics = false;
  bool noColor = false;
  std::string shell;            ///< whose completion script is wanted
  std::string completion;       ///< that script
  std::string action = "show";  ///< with the outbox or the consent
  double draw = 0;              ///< a session's, for sampling
  /// What to show of what becomes of messages.
  struct Tap {
    std::optional<int> clientType;
    std::string backend;      ///< empty: all
    std::string outcome;      ///< empty: all
    bool messages = false;    ///< also of single messages
    bool bodies = false;      ///< with what was sent
    std::uint64_t count = 0;  ///< the number of records after which to end; 0: never
  } tap;

  // Storebags.
  std::string directory = ".";  ///< of a new key pair
  std::string key;              ///< private or public, depending on the command
  std::string source;           ///< source or signed document, depending on the command
  std::string output;
  bool lenient = false;
  std::optional<std::string> storebagName;  ///< the signed keys; empty or nullopt: as in the source
  std::optional<std::int64_t> serial;
  std::optional<std::string> expires;  ///< a date, or a date and time of UTC
  StorebagOptions authoring;
};

/// Throws `Exit` if the tool should just exit; help, version or error have been printed then.
Invocation parseCommandLine(int argc, char** argv);

// These return the exit status. They throw `Exit` after a failure that they have reported; the text of any
// other exception is meant for the user.

int runStates(const Invocation& invocation, const Output& output);
int runDisplayURL(const Invocation& invocation, const Output& output);
int runFlush(const Invocation& invocation, const Output& output);
int runSend(const Invocation& invocation, const Output& output);
int runSendOnce(const Invocation& invocation, const Output& output);
int runUploadFile(const Invocation& invocation, const Output& output);
int runUploadLog(const Invocation& invocation, const Output& output);
/// Shows the messages of a family of sessions, until the daemon closes the aggregation, the requested number
/// has arrived, or SIGINT or SIGTERM arrives. Blocks these two signals for the process.
int runAggregate(const Invocation& invocation, const Output& output);

int runPowerLog(const Invocation& invocation, const Output& output);

/// Shows the daemon's status. Returns kExitFailed if it is degraded.
int runStatus(const Invocation& invocation, const Output& output);
/// Shows what the daemon would do with a client's messages, and why.
int runExplain(const Invocation& invocation, const Output& output);
/// The status as a live page in the terminal.
int runTop(const Invocation& invocation, const Output& output);
/// Runs a collector and a daemon that reports everything to it, until a signal asks for the end or the given
/// program ends, whose exit status it returns then. Shows the events. Handles signals for the process.
int runDev(const Invocation& invocation, const Output& output);
/// Prints a completion script.
int runCompletion(const Invocation& invocation, const Output& output);
/// Shows what was lost or delayed.
int runDrops(const Invocation& invocation, const Output& output);
/// Makes the daemon end, so that it is started anew.
int runReload(const Invocation& invocation, const Output& output);
/// Shows, holds, releases or exports what waits.
int runOutbox(const Invocation& invocation, const Output& output);
/// Shows, grants or withdraws the user's consent.
int runConsent(const Invocation& invocation, const Output& output);
/// Shows what becomes of messages, while it happens, until the daemon ends.
int runTap(const Invocation& invocation, const Output& output);

int runStorebagKeygen(const Invocation& invocation, const Output& output);
int runStorebagSign(const Invocation& invocation, const Output& output);
int runStorebagVerify(const Invocation& invocation, const Output& output);
int runStorebagShow(const Invocation& invocation, const Output& output);

}  // namespace vesk
