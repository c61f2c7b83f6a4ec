// The run loop with its busy marker and a service manager simulated by a real socket.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <cstdlib>
#include <future>
#include <thread>

#include "daemon/RunLoop.h"
#include "platform/ipc/UnixSocket.h"
#include "tests/support/TempDirectory.h"

namespace vesk {
namespace {

using namespace std::chrono_literals;
using Outcome = RunLoop::Outcome;

class RunLoopTest : public testing::Test {
 protected:
  void TearDown() override { ::unsetenv("NOTIFY_SOCKET"); }

  /// The next notification to the manager.
  std::string notification() const {
    char text[256];
    ssize_t size = ::recv(_manager.get(), text, sizeof text, 0);
    return size < 0 ? "nothing" : std::string(text, static_cast<std::size_t>(size));
  }

  const test::TempDirectory _directory;
  const FileDescriptor _manager = [this] {
    FileDescriptor manager(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    UnixSocketAddress address(_directory / "notify");
    EXPECT_EQ(::bind(manager.get(), address.get(), address.size()), 0);
    timeval patience{20, 0};
    ::setsockopt(manager.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setenv("NOTIFY_SOCKET", (_directory / "notify").c_str(), 1);
    return manager;
  }();
  ServiceManager _service;
  BusyMarker _busy;
};

TEST_F(RunLoopTest, StopsOnEachStopSignal) {
  for (int signal : {SIGTERM, SIGINT}) {
    RunLoop loop({}, _busy, _service);
    ::kill(::getpid(), signal);
    EXPECT_EQ(loop.run(), Outcome::Signalled);
  }
}

TEST_F(RunLoopTest, ASecondSignalEndsASlowStop) {
  EXPECT_EXIT(
      {
        RunLoop loop({}, _busy, _service);
        ::kill(::getpid(), SIGTERM);
        if (loop.run() == Outcome::Signalled) ::kill(::getpid(), SIGTERM);
        ::_exit(1);
      },
      testing::KilledBySignal(SIGTERM), "");
}

TEST_F(RunLoopTest, EndsWhenIdleButNotWhileBusy) {
  _busy.begin();
  _busy.begin();
  RunLoop loop({.idleExit = 1ms}, _busy, _service);
  auto outcome = std::async(std::launch::async, [&] { return loop.run(); });
  _busy.end();
  EXPECT_EQ(outcome.wait_for(50ms), std::future_status::timeout);
  EXPECT_TRUE(_busy.isBusy());
  _busy.end();
  EXPECT_EQ(outcome.get(), Outcome::Idle);
}

TEST_F(RunLoopTest, TellsTheManagerHowItGoes) {
  ::setenv("WATCHDOG_USEC", "20000", 1);
  ServiceManager service;
  EXPECT_EQ(service.watchdogInterval(), 10ms);
  EXPECT_EQ(std::getenv("WATCHDOG_USEC"), nullptr);
  RunLoop loop({}, _busy, service);
  auto outcome = std::async(std::launch::async, [&] { return loop.run(); });
  for (int ping = 0; ping < 3; ++ping) EXPECT_EQ(notification(), "WATCHDOG=1");
  loop.stop();
  outcome.get();
}

TEST_F(RunLoopTest, TakesOverTheManagersSocket) {
  const FileDescriptor listening = listenOnUnixSocket(_directory / "listen");
  const auto inherit = [&](int first, int second) {
    ::dup2(first, 3);
    ::dup2(second, 4);
    ::setenv("LISTEN_FDS", "2", 1);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    ServiceManager service;
    bool taken = service.isSocketActivated() && service.takeListeningSocket().get() >= 3;
    bool again = static_cast<bool>(service.takeListeningSocket());
    ::_exit(taken && !again && !std::getenv("LISTEN_FDS") ? 0 : 1);
  };
  EXPECT_EXIT(inherit(listening.get(), 2), testing::ExitedWithCode(0), "descriptor 4 is of no use");
  EXPECT_EXIT(inherit(2, 2), testing::ExitedWithCode(1), "descriptor 3 is of no use");
}

}  // namespace
}  // namespace vesk
