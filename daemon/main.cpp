// veskreportingd: accepts reporting messages from local clients and delivers them.
#include <VeskReporting/VeskReportingLogging.h>

#include <cstdio>
#include <cstdlib>
#include <exception>

#include "daemon/Daemon.h"
#include "daemon/DaemonOptions.h"
#include "daemon/RunLoop.h"
#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/sandbox/Sandbox.h"
#include "platform/service/DescriptorLimit.h"
#include "platform/service/Journal.h"
#include "platform/service/ProcessMemory.h"
#include "platform/service/SchedulingClass.h"

namespace {

constexpr char kServiceName[] = "com.corvane.veskreportingd";
// The service manager starts us again on the next connection.
constexpr std::chrono::seconds kIdleExitWhenActivated{300};
// The unit restarts the service on this exit status (EX_TEMPFAIL), and counts it as a success.
constexpr int kStartAnew = 75;
constexpr std::chrono::seconds kPatienceOfLog{1};

int run(const vesk::DaemonOptions& options) {
  vesk::enterSchedulingClass(vesk::SchedulingClass::Utility, 0);
  vesk::SystemLog::setJournal(vesk::writeToJournal);
  vesk::VeskReportingLogging::startLogging("veskreportingd", "Daemon");
  vesk::SystemLog::setPatience(kPatienceOfLog);
  if (options.sandbox) {
    if (auto entered = vesk::enterSandbox(kServiceName); !entered) {
      VESK_LOG_ERROR("main: confine_enter() fails: %s\n", entered.error().text.c_str());
      return -1;
    }
  }
  vesk::ServiceManager serviceManager;
  vesk::BusyMarker busyMarker;
  vesk::RunLoop::Options loopOptions{options.idleExit};
  if (!options.idleExit && serviceManager.isSocketActivated()) loopOptions.idleExit = kIdleExitWhenActivated;
  vesk::Daemon* running = nullptr;
  loopOptions.onPause = [&running] {
    vesk::releaseFreePages();
    if (running) running->takeStock();
  };
  vesk::RunLoop loop(loopOptions, busyMarker, serviceManager);

  vesk::Daemon daemon(serviceManager, busyMarker, [&loop] { loop.reload(); });
  running = &daemon;
  daemon.resume();
  VESK_LOG_INFO("%s", options.sandbox ? "main: Listener resumes with sandbox, start loop."
                                      : "main: Listener resumes without sandbox, start loop.");
  serviceManager.notifyReady();
  vesk::releaseStartUpPages();
  const bool reloads = loop.run() == vesk::RunLoop::Outcome::Reload;
  if (reloads) {
    VESK_LOG_INFO("%s", serviceManager.isPresent()
                            ? "main: Ending, so that the service manager starts the daemon anew."
                            : "main: Ending. No service manager starts the daemon anew.");
  }
  daemon.takeStock();
  serviceManager.notifyStopping();
  const bool haveEnded = daemon.stop();
  vesk::VeskReportingLogging::close();
  if (!haveEnded) std::_Exit(1);  // its sessions' threads still use what would be destroyed
  return reloads && vesk::ServiceManager::isPresent() ? kStartAnew : 0;
}

}  // namespace

int main(int argc, char** argv) {
  auto parsed = vesk::parseDaemonOptions(argc, argv);
  if (const int* status = std::get_if<int>(&parsed)) return *status;
  const auto& options = std::get<vesk::DaemonOptions>(parsed);
  vesk::setUpAllocator();
  vesk::endWhenOutOfMemory();
  vesk::raiseDescriptorLimit();
  if (options.root) vesk::setRootPrefix(*options.root);
  vesk::SystemLog::setLevel(options.logLevel);
  try {
    return run(options);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("main: %s", error.what());
    return 1;
  }
}
