#include <exception>
#include <string>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "tools/veskreport/AggregateCommand.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/Output.h"
#include "tools/veskreport/PowerLogCommand.h"
#include "tools/veskreport/SendCommands.h"
#include "tools/veskreport/SessionCommands.h"
#include "tools/veskreport/StorebagCommands.h"

namespace {

using namespace vesk;

int run(const Invocation& invocation, const Output& output) {
  switch (invocation.command) {
    case Command::States:
      return runStates(invocation, output);
    case Command::DisplayURL:
      return runDisplayURL(invocation, output);
    case Command::Send:
      return runSend(invocation, output);
    case Command::SendOnce:
      return runSendOnce(invocation, output);
    case Command::Flush:
      return runFlush(invocation, output);
    case Command::UploadFile:
      return runUploadFile(invocation, output);
    case Command::UploadLog:
      return runUploadLog(invocation, output);
    case Command::Aggregate:
      return runAggregate(invocation, output);
    case Command::PowerLog:
      return runPowerLog(invocation, output);
    case Command::StorebagKeygen:
      return runStorebagKeygen(invocation.storebag, output);
    case Command::StorebagSign:
      return runStorebagSign(invocation.storebag, output);
    case Command::StorebagVerify:
      return runStorebagVerify(invocation.storebag, output);
    case Command::StorebagShow:
      return runStorebagShow(invocation.storebag, output);
  }
  return kExitUsage;
}

}  // namespace

int main(int argc, char** argv) {
  SystemLog::open("veskreport", "Tool");
  SystemLog::setLevel(static_cast<int>(LogLevel::Warning));
  try {
    CommandLine commandLine = parseCommandLine(argc, argv);
    if (!commandLine.invocation) return commandLine.exitStatus;
    const Invocation& invocation = *commandLine.invocation;
    if (!invocation.identity.root.empty()) setRootPrefix(invocation.identity.root);
    return run(invocation, Output(invocation.json));
  } catch (const std::exception& error) {
    return Output(false).failed(error.what());
  }
}
