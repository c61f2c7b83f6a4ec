// Retransmission, acknowledgement, limits and shutdown of datagrams, tick by tick over real sockets.
#include <gtest/gtest.h>

#include <numeric>

#include "backends/dashboard/DashboardDelivery.h"
#include "platform/queue/QueueThread.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DashboardServer.h"
#include "tests/support/SimulatedQueues.h"
#include "tests/support/SocketFaults.h"

namespace vesk::test {
namespace {

std::shared_ptr<const Outcomes> outcomesIn(Counters& counters) {
  return std::make_shared<Outcomes>("dashboard", BackendIdentity{}, counters,
                                    std::make_shared<DeliveryTap>());
}

using std::chrono::milliseconds;

constexpr char kCleanUpLine[] = "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.";
constexpr char kLastResortLine[] =
    "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms.";

class Delivery : public testing::Test {
 protected:
  ~Delivery() override { _queue->stop(); }
  void start(bool reliable = true, milliseconds tick = milliseconds(500)) {
    UDPSocket socket;
    ASSERT_TRUE(socket.open());
    _delivery =
        std::make_shared<DashboardDelivery>(std::move(socket), _queue, _linger, outcomesIn(_counters));
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
  /// Advances the time in steps and returns when (in ms from now) each event arrived.
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
  CapturedLog _log;
};

TEST_F(Delivery, SendsUntilItArrivesOrIsGivenUp) {
  constexpr int kShort = SocketFaults::kShort, kNoRoute = ENETUNREACH;
  // sends: the outcomes of the first calls
  // lostAt: -1: never
  const std::tuple<const char*, bool, std::deque<int>, std::vector<int>, int> cases[] = {
      {"nothing fails", true, {}, {0, 1000, 2500, 5000, 9500}, 10'000},
      {"first send", true, {EPERM}, {500, 1500, 3000, 5500, 10'000}, 10'500},
      {"short first send", true, {kShort}, {500, 1500, 3000, 5500, 10'000}, 10'500},
      {"two sends", true, {kShort, ECONNREFUSED}, {1000, 2000, 3500, 6000, 10'500}, 11'000},
      {"first again", true, {0, EPERM}, {0, 1500, 3000, 5500, 10'000}, 10'500},
      {"short again", true, {0, kShort, EAGAIN}, {0, 2000, 3500, 6000, 10'500}, 11'000},
      {"last again", true, {0, 0, 0, 0, EPERM, kShort}, {0, 1000, 2500, 5000, 10'500}, 11'000},
      {"no room", true, {EAGAIN, EAGAIN}, {20, 1000, 2500, 5000, 9500}, 10'000},
      {"no way, and another", true, {kNoRoute}, {0, 1000, 2500, 5000, 9500}, 10'000},
      {"unreliable: nothing fails", false, {}, {0}, -1},
      {"unreliable: first send", false, {EPERM}, {500}, -1},
      {"unreliable: short sends", false, {kShort, EPERM, kShort}, {1500}, -1},
      {"unreliable: no room", false, {EAGAIN}, {10}, -1},
      {"unreliable: no room later", false, {EPERM, EAGAIN}, {1000}, -1},
      {"unreliable: no way", false, {EADDRNOTAVAIL, EINVAL, kNoRoute, EDESTADDRREQ}, {1000}, -1},
      {"unreliable: no other way", false, {kNoRoute, kNoRoute}, {500}, -1}};
  for (const auto& [description, reliable, sends, expectedArrivals, expectedLostAt] : cases) {
    SCOPED_TRACE(description);
    start(reliable);
    const auto lostBefore = lost(DropReason::Unacknowledged);
    SocketFaults::sends = sends;
    send(7);
    std::vector<int> arrivals;
    int lostAt = -1;
    for (int at = 0; at <= 25'000; at += 10) {
      if (at > 0) _queue->advance(milliseconds(10));
      arrivals.insert(arrivals.end(), _server.take().size(), at);
      if (lostAt < 0 && lost(DropReason::Unacknowledged) > lostBefore) lostAt = at;
    }
    EXPECT_EQ(arrivals, expectedArrivals);
    EXPECT_EQ(lostAt, expectedLostAt);
    EXPECT_TRUE(SocketFaults::sends.empty());
    EXPECT_EQ(_queue->waiting(), 0u);
    EXPECT_EQ(lost(DropReason::OverBound), 0u);
  }
}

TEST_F(Delivery, KeepsItsBeatWhileItIdles) {
  start();
  _queue->advance(milliseconds(1300));
  EXPECT_EQ(_queue->waiting(), 0u) << "no timer while nothing is pending";
  send(1);  // the ticks are at 1500 and 2000
  EXPECT_EQ(arrivalsDuring(3000), (Arrivals{{0, 1}, {700, 1}, {2200, 1}}));
}

TEST_F(Delivery, AnAcknowledgementTakesTheFirstDatagramWithItsEventID) {
  auto carrying = [](std::uint16_t id, std::size_t size) {
    std::string bytes(2000, '\x7F');
    bytes[60] = static_cast<char>(id >> 8);
    bytes[61] = static_cast<char>(id);
    return bytes.substr(0, size);
  };
  const std::uint16_t ids[] = {5, 0x1234, 5, 0x127F, 0x1200};
  // others: those sent again
  const std::tuple<const char*, std::vector<std::string>, std::vector<int>> cases[] = {
      {"unknown", {carrying(9, 64)}, {0, 1, 2, 3, 4}},
      {"little-endian", {carrying(0x3412, 64)}, {0, 1, 2, 3, 4}},
      {"nothing in it", {"", "x"}, {0, 1, 2, 3, 4}},
      // The buffer still contains the first datagram; together with it, the second would be 0x1234.
      {"a byte too short", {carrying(0xFF34, 1088), carrying(0x1200, 61)}, {0, 1, 2, 3, 4}},
      {"just long enough", {carrying(0x1234, 62)}, {0, 2, 3, 4}},
      {"longer than any datagram", {carrying(0x1200, 2000)}, {0, 1, 2, 3}},
      {"one of two", {carrying(5, 64)}, {1, 2, 3, 4}},
      {"both", {carrying(5, 64), carrying(5, 64)}, {1, 3, 4}},
      {"all, in another order",
       {carrying(0x127F, 62), carrying(5, 62), carrying(0x1200, 62), carrying(0x1234, 62), carrying(5, 62)},
       {}}};
  for (const auto& [description, answers, expectedOthers] : cases) {
    SCOPED_TRACE(description);
    start();
    for (std::size_t i = 0; i < std::size(ids); ++i) {
      auto buffer = std::make_unique<DashboardDelivery::Buffer>();
      (*buffer)[0] = static_cast<char>(i);
      _delivery->send(std::move(buffer), kDashboardHeaderSize, ids[i]);
    }
    _queue->run();
    EXPECT_EQ(_server.take().size(), std::size(ids));
    for (const auto& answer : answers) _server.send(answer);
    _queue->advance(milliseconds(1000));
    std::vector<int> others;
    for (const auto& datagram : _server.take()) others.push_back(datagram[0]);
    EXPECT_EQ(others, expectedOthers);
    _delivery->cleanup();
    _queue->advance(milliseconds(30'000));
    _server.take();
  }
  for (std::size_t size : {0u, 1u, 60u, 61u})  // of a longer buffer
    EXPECT_EQ(eventIDOfAcknowledgement(std::string_view(carrying(5, 64)).substr(0, size)), std::nullopt);
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

TEST_F(Delivery, WhatComesFasterThanItGoesOutIsBounded) {
  start();
  for (int i = 0; i < 1030; ++i) handOver(1);
  EXPECT_EQ(lost(DropReason::OverBound), 6u);
  _queue->run();
  EXPECT_EQ(lost(DropReason::OverBound), 6u + 1024u - 50u);
}

TEST_F(Delivery, ABurstWaitsForRoomInTheSystem) {
  for (const bool linkMoves : {true, false}) {
    const long before = openDescriptors();
    start(false);
    for (int i = 0; i < 3000; ++i) SocketFaults::sends.push_back(linkMoves && i % 4 < 3 ? 0 : EAGAIN);
    for (std::uint16_t id = 1; id <= 200; ++id) send(id);
    for (std::uint16_t id = 201; id <= 300; ++id) handOver(id);
    cleanup();
    _delivery.reset();
    std::vector<int> arrived, all(300);
    std::iota(all.begin(), all.end(), 1);
    for (const auto& [at, id] : arrivalsDuring(3000, 10)) arrived.push_back(id);
    EXPECT_EQ(arrived, linkMoves ? all : std::vector<int>{});
    EXPECT_EQ(lost(DropReason::Unacknowledged), 0u);
    _queue->advance(milliseconds(10'500));
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(lost(DropReason::Unacknowledged), linkMoves ? 0u : 300u) << "the last resort gives them up";
    EXPECT_EQ(lost(DropReason::OverBound), 0u);
    EXPECT_EQ(_queue->waiting(), 0u);
    SocketFaults::sends.clear();
  }
}

TEST_F(Delivery, CleanupGivesEverythingBackOnce) {
  for (const int variant : {0, 1, 2}) {
    const long before = openDescriptors();
    _queue->refusesReadSources = variant == 2;  // reliable nevertheless
    start(variant != 0);
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
    _delivery.reset();  // the session has dropped its reference
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

TEST(UDPSocketTest, FindsAnotherWayOrReceivesNothing) {
  DashboardServer server;
  UDPSocket socket;
  EXPECT_EQ(socket.reconnect(server.endpoint()).error().number, EBADF);
  ASSERT_TRUE(socket.open() && socket.bindToAnyPort());
  EXPECT_EQ(socket.reconnect({0xFFFF'FFFF, 1}).error().number, EACCES);
  EXPECT_EQ(socket.localEndpoint(), std::nullopt) << "a port at which anybody could acknowledge";
  EXPECT_EQ(socket.send("x"), UDPSocket::Outcome::NoRoute);
  EXPECT_TRUE(socket.reconnect(server.endpoint()));
  EXPECT_EQ(socket.send("y"), UDPSocket::Outcome::Sent);
  EXPECT_EQ(server.take(), std::vector<std::string>{"y"});
}

TEST(DeliveryOnThreads, EndAtOnceBeyondTheirPlacesAndLeaveNothingBehindWhenStopped) {
  constexpr int kPlaces = 8;
  const long before = openDescriptors();
  Counters counters;
  auto linger = std::make_shared<DashboardLinger>(kPlaces);
  {
    DashboardServer server;  // never answers
    QueueThread thread;
    const long started = openDescriptors();
    for (int i = 0; i < 3 * kPlaces; ++i) {
      UDPSocket socket;
      EXPECT_TRUE(socket.open());
      auto delivery = std::make_shared<DashboardDelivery>(std::move(socket), thread.makeQueue("test"), linger,
                                                          outcomesIn(counters));
      delivery->useReliableUDP();
      EXPECT_TRUE(delivery->connect(server.endpoint()) && delivery->start(milliseconds(500)));
      delivery->send(std::make_unique<DashboardDelivery::Buffer>(), kDashboardHeaderSize, 1);
      delivery->cleanup();
      EXPECT_LE(openDescriptors(), started + kPlaces + 4) << "three are the thread's, one may be on its way";
    }
    EXPECT_FALSE(thread.waitUntilUnused(milliseconds(1)));
    EXPECT_GE(server.take().size(), 3u * kPlaces) << "each went out, some maybe again";
    thread.stop();
    EXPECT_TRUE(thread.waitUntilUnused(milliseconds(1)));
  }
  EXPECT_EQ(openDescriptors(), before);
  ASSERT_EQ(counters.snapshot().size(), 1u);
  EXPECT_EQ(counters.snapshot()[0].reason, DropReason::Unacknowledged);
  EXPECT_EQ(counters.snapshot()[0].count, 3u * kPlaces);
  for (int i = 0; i < kPlaces; ++i) EXPECT_TRUE(linger->try_acquire());
}

}  // namespace
}  // namespace vesk::test
