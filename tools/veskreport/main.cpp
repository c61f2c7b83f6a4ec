#include <exception>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "tools/veskreport/CommandLine.h"

int main(int argc, char** argv) {
  using namespace vesk;
  SystemLog::open("veskreport", "Tool");
  SystemLog::setLevel(static_cast<int>(LogLevel::Warning));
  Invocation invocation;
  try {
    invocation = parseCommandLine(argc, argv);
    if (!invocation.root.empty()) setRootPrefix(invocation.root);
    return invocation.command(invocation, Output(invocation.json));
  } catch (const Exit& exit) {
    return exit.status;
  } catch (const std::exception& error) {
    return Output(invocation.json).failed(error.what());
  }
}
