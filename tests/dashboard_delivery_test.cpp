// Retransmission, acknowledgement, bounds and shutdown of datagrams, tick by tick over real sockets.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <cstring>
#include <numeric>

#include "backends/DashboardDelivery.h"
#include "platform/queue/TimedQueuePool.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DashboardServer.h"
#include "tests/support/SimulatedQueues.h"

namespace vesk::test {
namespace {

using std::chrono::milliseconds;

constexpr char kCleanUpLine[] = "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.";
constexpr char kLastResortLine[] =
    "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms.";

class Delivery : public testing::Test {
 protected:
  ~Delivery() override { _queue->stop(); }
  void start(bool reliable = true, milliseconds tick = milliseconds(500)) {
    UDPSocket socket;
    ASSERT_EQ(socket.open(), 0);
    _descriptor = socket.descriptor();
    _delivery =
        std::make_shared<DashboardDelivery>(std::move(socket), _queue, _linger, _counters, "dashboard");
    if (reliable) _delivery->useReliableUDP();
    ASSERT_TRUE(_delivery->connect(_server.endpoint()));
    ASSERT_TRUE(_delivery->start(tick));
    _queue->run();
  }
  void handOver(std::uint16_t eventID) {
    auto buffer = std::make_unique<DashboardDelivery::Buffer>();
    (*buffer)[60] = static_cast<char>(eventID >> 8);
    (*buffer)[61] = static_cast<char>(eventID);
    _delivery->send(std::move(buffer), kDashboardHeaderSize, eventID);
  }
  void send(std::uint16_t eventID) {
    handOver(eventID);
    _queue->run();
  }
  void cleanup() {
    _delivery->cleanup();
    _queue->run();
  }
  /// Lets time pass in steps and gives when, in ms from now, which event arrived.
  std::vector<std::pair<int, int>> arrivalsDuring(int duration, int step = 100) {
    std::vector<std::pair<int, int>> arrivals;
    for (int at = 0; at <= duration; at += step) {
      if (at > 0) _queue->advance(milliseconds(step));
      for (int id : _server.takeEventIDs()) arrivals.emplace_back(at, id);
    }
    return arrivals;
  }
  std::uint64_t lost(DropReason reason) const {
    std::uint64_t sum = 0;
    for (const auto& count : _counters.snapshot()) sum += count.reason == reason ? count.count : 0;
    return sum;
  }

  using Arrivals = std::vector<std::pair<int, int>>;
  Counters _counters;
  DashboardServer _server;
  std::shared_ptr<SimulatedQueue> _queue = std::make_shared<SimulatedQueue>();
  std::shared_ptr<DashboardLinger> _linger = std::make_shared<DashboardLinger>(1);
  std::shared_ptr<DashboardDelivery> _delivery;
  int _descriptor = -1;  // the delivery's
  CapturedLog _log;
};

TEST_F(Delivery, SendsAgainFourTimesAndThenGivesUp) {
  for (int tick : {500, 1, 40}) {
    SCOPED_TRACE(tick);
    start(true, milliseconds(tick));
    const auto lostBefore = lost(DropReason::Unacknowledged);
    send(7);
    EXPECT_EQ(arrivalsDuring(19 * tick, tick),
              (Arrivals{{0, 7}, {2 * tick, 7}, {5 * tick, 7}, {10 * tick, 7}, {19 * tick, 7}}));
    EXPECT_EQ(lost(DropReason::Unacknowledged), lostBefore);
    EXPECT_EQ(arrivalsDuring(100 * tick, tick), Arrivals{});
    EXPECT_EQ(lost(DropReason::Unacknowledged), lostBefore + 1);
  }
}

TEST_F(Delivery, KeepsItsBeatWhileItIdles) {
  start();
  _queue->advance(milliseconds(1300));
  EXPECT_EQ(_queue->waiting(), 0u) << "no timer while nothing is pending";
  send(1);  // the beats are at 1500 and 2000
  EXPECT_EQ(arrivalsDuring(3000), (Arrivals{{0, 1}, {700, 1}, {2200, 1}}));
}

TEST_F(Delivery, AnAcknowledgedDatagramIsNeverSentAgain) {
  start();
  send(1);
  send(0x1234);
  EXPECT_EQ(arrivalsDuring(2500),
            (Arrivals{{0, 1}, {0, 0x1234}, {1000, 1}, {1000, 0x1234}, {2500, 1}, {2500, 0x1234}}));
  _server.acknowledge(0x1234);
  EXPECT_EQ(arrivalsDuring(2500), (Arrivals{{2500, 1}}));
}

TEST_F(Delivery, IgnoresWhatAcknowledgesNothing) {
  start();
  send(0);
  _server.take();
  _server.acknowledge(9);
  _server.acknowledge(0, 61);  // a byte too short
  _server.send("");
  EXPECT_EQ(arrivalsDuring(1000), (Arrivals{{1000, 0}}));
  _server.send(std::string(2000, '\0'));  // longer than any datagram, and carries 0
  EXPECT_EQ(arrivalsDuring(9000), Arrivals{});
}

TEST_F(Delivery, OneAcknowledgementTakesOneOfTwoDatagramsWithItsEventID) {
  start();
  send(5);
  _queue->advance(milliseconds(500));
  send(5);
  _server.take();
  _server.acknowledge(5);
  EXPECT_EQ(arrivalsDuring(1000), (Arrivals{{1000, 5}})) << "the older one is gone, which was due after 500";
}

TEST_F(Delivery, TheOldestOfFiftyOneGoes) {
  start();
  for (std::uint16_t id = 1; id <= 51; ++id) send(id);
  EXPECT_EQ(_server.takeEventIDs().size(), 51u) << "each went out once";
  EXPECT_EQ(lost(DropReason::OverBound), 1u);
  _queue->advance(milliseconds(1000));
  std::vector<int> others(50);
  std::iota(others.begin(), others.end(), 2);
  EXPECT_EQ(_server.takeEventIDs(), others);
}

TEST_F(Delivery, WithoutReliabilityOnlyWhatCouldNotBeSentWaits) {
  start(false);
  send(1);
  EXPECT_EQ(arrivalsDuring(20'000), (Arrivals{{0, 1}}));
  EXPECT_EQ(_queue->readers(), 0u);
  _server.stop();
  send(2);  // goes out, and its refusal comes back
  send(3);  // is told of it
  EXPECT_EQ(_queue->waiting(), 1u) << "3 waits for the next tick";
  _queue->advance(milliseconds(500));  // goes out
  _queue->advance(milliseconds(500));
  EXPECT_EQ(_queue->waiting(), 0u);
  EXPECT_EQ(lost(DropReason::Unacknowledged), 0u);
}

TEST_F(Delivery, AServerThatIsGoneCostsFiftyDatagramsAtMost) {
  start();
  _server.stop();
  for (int i = 0; i < 1000; ++i) send(static_cast<std::uint16_t>(i));
  EXPECT_EQ(lost(DropReason::OverBound), 950u);
  _queue->advance(milliseconds(60'000));
  EXPECT_EQ(lost(DropReason::Unacknowledged), 50u);
  EXPECT_EQ(_queue->waiting(), 0u);
}

TEST_F(Delivery, WhatComesFasterThanItGoesOutIsBounded) {
  start();
  for (int i = 0; i < 1030; ++i)
    _delivery->send(std::make_unique<DashboardDelivery::Buffer>(), kDashboardHeaderSize, 1);
  EXPECT_EQ(lost(DropReason::OverBound), 6u);
  _queue->run();
  EXPECT_EQ(lost(DropReason::OverBound), 6u + 1024u - 50u);
}

TEST_F(Delivery, ABurstWaitsForRoomInTheSystem) {
  for (const bool linkMoves : {true, false}) {
    const long before = openDescriptors();
    start(false);
    {
      // Stands in for a link that takes a few datagrams at a time.
      int ends[2];
      ASSERT_EQ(::socketpair(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK, 0, ends), 0);
      const FileDescriptor link(ends[0]), farEnd(ends[1]);
      const int smallest = 1;
      ASSERT_EQ(::setsockopt(link.get(), SOL_SOCKET, SO_SNDBUF, &smallest, sizeof smallest), 0);
      ASSERT_EQ(::dup2(link.get(), _descriptor), _descriptor);
      for (std::uint16_t id = 1; id <= 200; ++id) send(id);
      for (std::uint16_t id = 201; id <= 300; ++id) handOver(id);
      cleanup();
      _delivery.reset();
      std::vector<int> arrived, all(300);
      std::iota(all.begin(), all.end(), 1);
      for (int i = 0; linkMoves && i < 300; ++i) {
        char datagram[kDashboardHeaderSize];
        while (::recv(farEnd.get(), datagram, sizeof datagram, 0) > 0)
          arrived.push_back(eventIDOfAcknowledgement({datagram, sizeof datagram}).value_or(0));
        _queue->advance(DashboardDelivery::kRoomWait);
      }
      EXPECT_EQ(arrived == all, linkMoves) << arrived.size();
      EXPECT_EQ(lost(DropReason::Unacknowledged), 0u);
      _queue->advance(milliseconds(10'500));
    }
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(lost(DropReason::Unacknowledged) > 0, !linkMoves) << "the last resort gives them up";
    EXPECT_EQ(lost(DropReason::OverBound), 0u);
    EXPECT_EQ(_queue->waiting(), 0u);
  }
}

TEST_F(Delivery, WithoutMemoryOnlyThatDatagramIsLost) {
  start();
  _queue->refusesWork = true;
  send(1);
  EXPECT_EQ(lost(DropReason::OverBound), 1u);
  _queue->refusesWork = false;
  send(2);
  EXPECT_EQ(arrivalsDuring(0), (Arrivals{{0, 2}}));
}

TEST_F(Delivery, CleanupGivesEverythingBackOnce) {
  for (bool reliable : {true, false}) {
    const long before = openDescriptors();
    start(reliable);
    _queue->advance(milliseconds(700));
    cleanup();
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(_queue->waiting() + _queue->readers(), 0u);
    cleanup();
    send(1);  // from a session that has not noticed yet
    EXPECT_EQ(arrivalsDuring(1000), Arrivals{});
    std::weak_ptr<DashboardDelivery> gone = _delivery;
    _delivery.reset();
    EXPECT_TRUE(gone.expired());
    EXPECT_EQ(_log.countContaining(7, "myPeriodicTask"), 0) << "nothing was pending";
  }
}

TEST_F(Delivery, CleanupLetsAnAnsweringServerFinish) {
  for (bool ticksFirst : {false, true}) {
    SCOPED_TRACE(ticksFirst);
    const long before = openDescriptors();
    start();
    send(1);
    cleanup();
    _delivery.reset();  // the session has let go
    if (ticksFirst) _queue->advance(milliseconds(500));
    EXPECT_EQ(openDescriptors(), before + 1);
    _server.take();
    _server.acknowledge(1);
    _log.clear();
    _queue->advance(milliseconds(500));
    EXPECT_EQ(_log.count(7, kCleanUpLine), 1);
    EXPECT_EQ(_log.count(7, kLastResortLine), 0);
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(_queue->waiting() + _queue->readers(), ticksFirst ? 1u : 0u);
    _queue->advance(milliseconds(20'000));
    EXPECT_EQ(_log.count(7, kCleanUpLine), 1) << "the last resort finds nothing to do";
  }
}

TEST_F(Delivery, CleanupEndsNineAndAHalfSecondsAfterTheNextTick) {
  const long before = openDescriptors();
  start();
  _queue->advance(milliseconds(200));
  send(1);
  _queue->advance(milliseconds(2000));
  send(2);
  cleanup();
  cleanup();
  _delivery.reset();
  _queue->advance(milliseconds(300));  // the tick at 2500
  EXPECT_EQ(_log.count(7, kLastResortLine), 1);
  _server.take();
  EXPECT_EQ(arrivalsDuring(9'499, 1).size(), 6u) << "both still go out again";
  EXPECT_EQ(openDescriptors(), before + 1);
  _queue->advance(milliseconds(1));
  EXPECT_EQ(openDescriptors(), before);
  EXPECT_EQ(_queue->waiting() + _queue->readers(), 0u);
  EXPECT_EQ(_log.count(7, kLastResortLine), 1);
  EXPECT_EQ(lost(DropReason::Unacknowledged), 2u) << "one was given up, one discarded";
  EXPECT_TRUE(_linger->try_acquire()) << "its place is free again";
}

/// Gives the loopback interface of this network a second address, in place of the one that it had.
void setDeviceAddress(const char* address, const char* mask) {
  UDPSocket socket;
  ASSERT_EQ(socket.open(), 0);
  ifreq request{};
  std::strcpy(request.ifr_name, "lo");
  request.ifr_flags = IFF_UP;
  ASSERT_EQ(::ioctl(socket.descriptor(), SIOCSIFFLAGS, &request), 0);
  std::strcpy(request.ifr_name, "lo:1");
  auto set = [&](unsigned long what, const char* text) {
    sockaddr_in value{};
    value.sin_family = AF_INET;
    ::inet_pton(AF_INET, text, &value.sin_addr);
    std::memcpy(&request.ifr_addr, &value, sizeof value);
    ASSERT_EQ(::ioctl(socket.descriptor(), what, &request), 0);
  };
  set(SIOCSIFADDR, address);
  set(SIOCSIFNETMASK, mask);
}

TEST_F(Delivery, GoesOnFromTheDevicesNewAddress) {
  constexpr int kNoNetwork = 77;
  const pid_t child = ::fork();
  if (child != 0) {
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    if (WIFEXITED(status) && WEXITSTATUS(status) == kNoNetwork) GTEST_SKIP() << "no network of its own";
    ASSERT_EQ(status, 0);
    return;
  }
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNET) != 0) ::_exit(kNoNetwork);
  for (bool reliable : {false, true}) {
    setDeviceAddress("192.0.2.2", "255.255.255.0");
    _server = DashboardServer(0xC0000282);  // 192.0.2.130
    start(reliable);
    send(1);
    setDeviceAddress("192.0.2.129", "255.255.255.128");
    send(2);
    EXPECT_EQ(_server.takeEventIDs(), (std::vector{1, 2}));
    for (std::uint16_t id : {1, 2}) _server.acknowledge(id);  // to where it is now
    setDeviceAddress("198.51.100.1", "255.255.255.0");        // from where no way leads to the server
    send(3);
    _queue->advance(milliseconds(5000));
    sockaddr_in local{};
    socklen_t size = sizeof local;
    ASSERT_EQ(::getsockname(_descriptor, reinterpret_cast<sockaddr*>(&local), &size), 0);
    EXPECT_EQ(local.sin_port, 0) << "where anybody could acknowledge what is pending";
    setDeviceAddress("192.0.2.129", "255.255.255.128");
    _queue->advance(milliseconds(500));
    EXPECT_EQ(_server.takeEventIDs(), std::vector{3});
  }
  EXPECT_TRUE(_counters.snapshot().empty());
  ::_exit(HasFailure() ? 1 : 0);
}

TEST_F(Delivery, GoesOnWithoutWhatItCanNotHave) {
  const long before = openDescriptors();
  {
    UDPSocket bound;
    ASSERT_EQ(bound.open() + bound.bindToAnyPort(), 0);
    DashboardDelivery twiceBound(std::move(bound), _queue, _linger, _counters, "dashboard");
    twiceBound.useReliableUDP();
    EXPECT_EQ(_log.count(3, "DashboardBackend(useReliableUDP): can't bind socket, 22"), 1);
    EXPECT_FALSE(twiceBound.isReliable());
  }
  _queue->refusesReadSources = true;
  start();
  EXPECT_EQ(_log.count(3, "DashboardBackend(useReliableUDP): can't create read source"), 1);
  EXPECT_TRUE(_delivery->isReliable());
  send(1);
  cleanup();
  _delivery.reset();
  _queue->advance(milliseconds(10'000));
  EXPECT_EQ(openDescriptors(), before) << "closed although no read source was there to be cancelled";
}

TEST(DeliveryOnThreads, EndAtOnceBeyondTheirPlacesAndLeaveNothingBehindWhenStopped) {
  constexpr int kPlaces = 8;
  const long before = openDescriptors();
  Counters counters;
  auto linger = std::make_shared<DashboardLinger>(kPlaces);
  {
    DashboardServer server;  // that does not answer
    TimedQueuePool pool(1);
    const long started = openDescriptors();
    for (int i = 0; i < 3 * kPlaces; ++i) {
      UDPSocket socket;
      ASSERT_EQ(socket.open(), 0);
      auto delivery = std::make_shared<DashboardDelivery>(std::move(socket), pool.makeQueue("test"), linger,
                                                          counters, "dashboard");
      delivery->useReliableUDP();
      ASSERT_TRUE(delivery->connect(server.endpoint()));
      ASSERT_TRUE(delivery->start(milliseconds(500)));
      delivery->send(std::make_unique<DashboardDelivery::Buffer>(), kDashboardHeaderSize, 1);
      delivery->cleanup();
      EXPECT_LE(openDescriptors(), started + kPlaces + 4) << "three are the pool's, one may be on its way";
    }
    EXPECT_FALSE(pool.waitUntilUnused(milliseconds(1)));
    EXPECT_GE(server.take().size(), 3u * kPlaces) << "each went out, some maybe again";
    pool.stop();
    EXPECT_TRUE(pool.waitUntilUnused(milliseconds(1)));
  }
  EXPECT_EQ(openDescriptors(), before);
  ASSERT_EQ(counters.snapshot().size(), 1u);
  EXPECT_EQ(counters.snapshot()[0].reason, DropReason::Unacknowledged);
  EXPECT_EQ(counters.snapshot()[0].count, 3u * kPlaces);
  for (int i = 0; i < kPlaces; ++i) EXPECT_TRUE(linger->try_acquire());
}

}  // namespace
}  // namespace vesk::test
