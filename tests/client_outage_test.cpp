#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <future>

#include "client/DrainBudget.h"
#include "client/ReconnectPolicy.h"
#include "client/StartPolicy.h"
#include "platform/ipc/UnixSocket.h"
#include "tests/support/ClientHarness.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

// ThreadSanitizer ends a process that starts threads after a fork.
#if defined(__SANITIZE_THREAD__)
constexpr bool kMayStartThreadsAfterFork = false;
#else
constexpr bool kMayStartThreadsAfterFork = true;
#endif

using ClientOutage = ClientHarness;

TEST_F(ClientOutage, SaysThatNoDaemonIsThere) {
  // Its destructor must not take the drain time, since there never was a daemon.
  VeskReporting session(options());
  auto connected = session.connect();
  EXPECT_EQ(connected.status, ReportingStatus::NotConnected);
  EXPECT_EQ(connected.detail, socket + ": No such file or directory");
  EXPECT_EQ(session.fetchDisplayURL(10ms).status, ReportingStatus::NotConnected);
  EXPECT_FALSE(session.isConnected());
  EXPECT_EQ(session.sendMessage(1, 1), ReportingStatus::Queued);
}

TEST_F(ClientOutage, SendsInOrderWhatWasQueuedBeforeTheDaemonWasThere) {
  VeskReporting session(options());
  EXPECT_FALSE(session.connect());
  EXPECT_EQ(session.setSessionInfo(sessionInfo), ReportingStatus::Queued);
  for (std::uint16_t i = 0; i < 100; ++i) EXPECT_EQ(session.sendMessage(1, i), ReportingStatus::Queued);
  daemon.emplace(socket, record);
  EXPECT_TRUE(session.flushMessagesAndWait());
  auto lines = record.lines();
  ASSERT_EQ(lines.size(), 102U);
  EXPECT_TRUE(lines[0].starts_with("setSessionInfo"));
  for (int i = 0; i < 100; ++i) {
    EXPECT_EQ(lines[static_cast<std::size_t>(i) + 1], "message 1 " + std::to_string(i) + " none");
  }
}

TEST_F(ClientOutage, StartsThoughItsCallerNoLongerWaits) {
  VeskReporting session(options());
  EXPECT_EQ(session.setSessionInfo(sessionInfo), ReportingStatus::Queued);
  for (int i = 0; i < 3; ++i) EXPECT_FALSE(session.startConfig(1ms));
  EXPECT_FALSE(session.fetchStates(Dictionary{{kVeskReportingUserInfoClientName, "second"}}, 1ms));
  EXPECT_FALSE(session.fetchDisplayURL(1ms));
  EXPECT_EQ(session.sendMessage(9, 1), ReportingStatus::Queued);
  daemon.emplace(socket, record);
  ASSERT_TRUE(record.waitFor("message 9 1"));
  auto lines = record.lines();
  ASSERT_EQ(lines.size(), 4u);
  EXPECT_TRUE(lines[0].starts_with("setSessionInfo"));
  EXPECT_EQ(lines[1], "startConfig");
  EXPECT_TRUE(lines[2].starts_with("fetchStates")) << lines[2];
  EXPECT_EQ(session.drops().total(), 1u);
}

TEST_F(ClientOutage, ConfiguresAndStartsAgainBeforeItSendsWhatIsQueued) {
  const Dictionary user{{kVeskReportingUserInfoClientName, "second"}};
  daemon.emplace(socket, record);
  VeskReporting session(options());
  EXPECT_EQ(session.setSessionInfo(sessionInfo, Dictionary{{kVeskReportingUserInfoClientName, "first"}}),
            ReportingStatus::Queued);
  EXPECT_TRUE(session.startConfig());
  EXPECT_TRUE(session.fetchStates(user));

  for (int restart = 1; restart <= 3; ++restart) {
    daemon.reset();
    std::size_t before = record.lines().size();
    EXPECT_EQ(session.sendMessage(9, static_cast<std::uint16_t>(restart)), ReportingStatus::Queued);
    daemon.emplace(socket, record);
    ASSERT_TRUE(record.waitFor("message 9 " + std::to_string(restart)));
    auto lines = record.lines();
    ASSERT_EQ(lines.size(), before + 3);
    EXPECT_EQ(lines[before], "setSessionInfo " + describe(sessionInfo) + " " + describe(user) + " []");
    EXPECT_EQ(lines[before + 1], "startConfig");
  }
  daemon.reset();
  daemon.emplace(socket, record);
  EXPECT_TRUE(record.waitFor("startConfig", 5)) << "without being asked";
}

TEST_F(ClientOutage, EndsTheCallsThatALostDaemonOwes) {
  record.holdsAnswers = true;
  daemon.emplace(socket, record);
  VeskReporting session(options());
  auto answer = std::async(std::launch::async, [&] { return session.fetchDisplayURL(); });
  ASSERT_TRUE(record.waitFor("fetchDisplayURL"));
  daemon.reset();
  EXPECT_EQ(answer.get().status, ReportingStatus::NotConnected);
}

TEST_F(ClientOutage, DropsAndCountsWhatDoesNotFit) {
  struct Case {
    const char* what;
    std::size_t messages, bytes, fitting;
  };
  const Dictionary payload{{"k", std::string(1000, 'x')}};
  for (const Case& c :
       {Case{"count", 10, 1'000'000, 10}, Case{"memory", 1000, 5'000, 3}, Case{"one always", 10, 1, 1}}) {
    SCOPED_TRACE(c.what);
    auto bounded = options();
    bounded.maximumQueuedMessages = c.messages;
    bounded.maximumQueuedBytes = c.bytes;
    VeskReporting session(bounded);
    std::size_t queued = 0;
    for (int i = 0; i < 20; ++i)
      queued += session.sendMessage(1, 1, payload) == ReportingStatus::Queued ? 1 : 0;
    EXPECT_EQ(queued, c.fitting);
    EXPECT_EQ(session.droppedMessages(), 20 - c.fitting);
    EXPECT_EQ(session.drops().queueFull, 20 - c.fitting);
  }
  VeskReporting session(options());
  int files = 0;
  while (files < 20 && session.uploadFile("/proc/self/exe", nullptr) == ReportingStatus::Queued) ++files;
  EXPECT_EQ(files, 16);
}

TEST_F(ClientOutage, LogsOfDropsWithoutHarmToAHostWhoseStandardErrorNobodyReads) {
  GTEST_FLAG_SET(death_test_style, "fast");
  auto dropTwo = [&](bool isFull) {
    ::alarm(60);
    ::signal(SIGPIPE, SIG_DFL);
    int ends[2];
    if (::pipe2(ends, O_NONBLOCK) != 0 || ::dup2(ends[1], STDERR_FILENO) < 0) ::_exit(1);
    if (!isFull) ::close(ends[0]);
    while (isFull && ::write(ends[1], "x", 1) > 0) {
    }
    ::fcntl(ends[1], F_SETFL, 0);
    auto bounded = options();
    bounded.maximumQueuedMessages = 1;
    {
      VeskReporting session(bounded);
      for (int i = 0; i < 3; ++i) static_cast<void>(session.sendMessage(1, 1));
    }
    ::_exit(0);
  };
  for (bool isFull : {false, true}) EXPECT_EXIT(dropTwo(isFull), testing::ExitedWithCode(0), "") << isFull;
}

TEST_F(ClientOutage, HasRoomAgainOnceTheDaemonTookWhatWaited) {
  auto bounded = options();
  bounded.maximumQueuedMessages = 2;
  VeskReporting session(bounded);
  EXPECT_EQ(session.sendMessage(1, 1), ReportingStatus::Queued);
  EXPECT_EQ(session.sendMessage(1, 2), ReportingStatus::Queued);
  EXPECT_EQ(session.sendMessage(1, 3), ReportingStatus::QueueFull);
  daemon.emplace(socket, record);
  ASSERT_TRUE(record.waitFor("message", 2));
  auto sent = session.flushMessagesAndWait();
  for (int i = 0; i < 100 && sent.status == ReportingStatus::QueueFull; ++i) {
    ASSERT_TRUE(session.connect());  // a round trip through the session's thread
    sent = session.flushMessagesAndWait();
  }
  EXPECT_EQ(sent.answer, "posted all");
}

TEST_F(ClientOutage, WaitsAtItsEndForADaemonThatItKnew) {
  daemon.emplace(socket, record);
  std::future<void> back;
  {
    VeskReporting session(options());
    ASSERT_TRUE(session.connect());
    daemon.reset();
    EXPECT_EQ(session.sendMessage(4, 2), ReportingStatus::Queued);
    back = std::async(std::launch::async, [&] { daemon.emplace(socket, record); });
  }
  back.get();
  EXPECT_EQ(record.count("message 4 2"), 1U);
}

TEST_F(ClientOutage, AForkedProcessIsRefusedAndHarmsNothing) {
  daemon.emplace(socket, record);
  auto session = std::make_unique<VeskReporting>(options());
  ASSERT_TRUE(session->connect());
  pid_t child = ::fork();
  if (child == 0) {
    bool isRefused = session->sendMessage(6, 6) == ReportingStatus::ForkedProcess &&
                     session->fetchDisplayURL().status == ReportingStatus::ForkedProcess &&
                     session->connect().status == ReportingStatus::ForkedProcess;
    session.reset();
    bool isServed = true;
    if (kMayStartThreadsAfterFork) {
      VeskReporting own(options());
      isServed = own.sendMessageAndWait(8, 8).status == ReportingStatus::Done;
    }
    ::_exit(isRefused && isServed ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(session->sendMessageAndWait(7, 7).answer, "posted");
  EXPECT_EQ(record.count("message 6 6"), 0U);
  EXPECT_EQ(record.count("message 8 8"), kMayStartThreadsAfterFork ? 1U : 0U);
}

TEST_F(ClientOutage, SaysThatTheDaemonHasTooManyConnections) {
  daemon.emplace(socket, record, 1);
  std::optional<VeskReporting> first(std::in_place, options());
  ASSERT_TRUE(first->connect());
  VeskReporting second(options());
  auto refused = second.connect();
  EXPECT_EQ(refused.status, ReportingStatus::TooManyConnections);
  EXPECT_EQ(refused.detail, socket + ": the daemon takes no more");
  EXPECT_EQ(second.fetchDisplayURL(10ms).status, ReportingStatus::TooManyConnections);
  first.reset();
  EXPECT_TRUE(second.fetchDisplayURL()) << "by itself, once there is room";
}

/// Runs `body` in its own process, which has one minute.
void expectToEnd(const std::function<bool()>& body) {
  if (!kMayStartThreadsAfterFork) GTEST_SKIP();
  const pid_t child = ::fork();
  if (child == 0) {
    ::alarm(60);
    ::_exit(body() ? 0 : 1);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
}

TEST_F(ClientOutage, AHostThatClosesAllDescriptorsNeitherHangsNorGetsAnythingInItsFiles) {
  daemon.emplace(socket, record);
  record.holdsAnswers = true;
  const std::string file = directory.write("uploaded", "contents");
  expectToEnd([&] {
    auto session = std::make_unique<VeskReporting>(options());
    VeskReporting idle(options());
    if (!session->connect() || !idle.connect()) return false;
    auto answer = std::async(std::launch::async, [&] { return session->fetchDisplayURL(1h); });
    while (!session->isConnected()) std::this_thread::yield();
    if (session->uploadFile(file, nullptr) != ReportingStatus::Queued) return false;
    ::closefrom(3);
    std::vector<FileDescriptor> own;
    for (int i = 0; i < 20; ++i) {
      own.emplace_back(::open((directory / ("own" + std::to_string(i))).c_str(), O_RDWR | O_CREAT, 0600));
    }
    std::ignore = idle.sendMessage(1, 1);
    std::ignore = session->sendMessage(1, 1);
    // It is chance whether the thread notices first that its connection or its wake-up descriptor is gone.
    const auto interrupted = answer.get().status;
    bool areRefused =
        (interrupted == ReportingStatus::Closed || interrupted == ReportingStatus::NotConnected) &&
        session->fetchDisplayURL(1h).status == ReportingStatus::Closed &&
        session->connect(1h).status == ReportingStatus::Closed;
    session.reset();
    bool areUntouched = std::all_of(own.begin(), own.end(), [](const FileDescriptor& descriptor) {
      struct stat status {};
      return ::fstat(descriptor.get(), &status) == 0 && status.st_size == 0;
    });
    return areRefused && areUntouched;
  });
}

TEST_F(ClientOutage, ManySessionsOfAProcessShareOneDrainTime) {
  DrainBudget budget;
  const DrainBudget::Clock::time_point now{1h};
  EXPECT_EQ(budget.grant(2s, now), 2s);
  budget.spend(2s, now);
  for (int i = 0; i < 20; ++i) {
    EXPECT_EQ(budget.grant(2s, now), DrainBudget::kLeast);
    budget.spend(DrainBudget::kLeast, now);
  }
  EXPECT_EQ(budget.grant(2s, now + 1500ms), 1500ms);
  EXPECT_EQ(budget.grant(2s, now + 2s), 2s);
  EXPECT_EQ(budget.grant(0s, now), 0s);

  FileDescriptor hung(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));  // never accepts
  UnixSocketAddress address(directory / "hung");
  ASSERT_EQ(::bind(hung.get(), address.get(), address.size()), 0);
  ASSERT_EQ(::listen(hung.get(), 8), 0);
  expectToEnd([&] {
    auto patient = options();
    patient.socketPath = directory / "hung";
    patient.drainTime = 1h;
    DrainBudget::shared().spend(1h, DrainBudget::Clock::now());
    VeskReporting session(patient);
    return session.sendMessage(1, 1) == ReportingStatus::Queued;
  });
}

TEST(ReconnectPolicy, WaitsTwiceAsLongAfterEachFailureAndAllowsOneEarlyAttemptAWait) {
  using Time = ReconnectPolicy::Time;
  ReconnectPolicy policy(50ms, 150ms);
  Time now{1h};
  EXPECT_LE(policy.due(), now);
  for (auto wait : {50ms, 100ms, 150ms, 150ms}) {
    policy.failed(now);
    EXPECT_EQ(policy.due(), now + wait);
    EXPECT_TRUE(policy.mayTryEarly());
    policy.triedEarly();
    policy.failed(now + 1ms);
    EXPECT_EQ(policy.due(), now + wait) << "an early attempt must not prolong the wait";
    EXPECT_FALSE(policy.mayTryEarly());
    now = policy.due();
  }
  policy.succeeded();
  EXPECT_LE(policy.due(), now);
  policy.failed(now);
  EXPECT_EQ(policy.due(), now + 50ms);
}

TEST(StartPolicy, RepeatsWithGrowingWaitsUntilThereIsAConfiguration) {
  const StartPolicy::Time now{1h};
  StartPolicy once(0ms);
  EXPECT_EQ(once.due(), StartPolicy::Time::max());
  for (auto wait : {900s, 1800s, 2880s, 2880s}) {
    once.answeredWithNothing(now, 0.8);
    EXPECT_EQ(once.due(), now + wait + wait / 5);
    once.started();
    EXPECT_EQ(once.due(), StartPolicy::Time::max());
  }
  once.answeredWithConfiguration(now);
  EXPECT_EQ(once.due(), StartPolicy::Time::max());
  once.answeredWithNothing(now, 0.0);
  EXPECT_EQ(once.due(), now + 900s);
  StartPolicy refreshed(2h);
  refreshed.answeredWithConfiguration(now);
  EXPECT_EQ(refreshed.due(), now + 2h);
}

TEST_F(ClientOutage, StartsAnewAtEachRefreshInterval) {
  daemon.emplace(socket, record);
  auto refreshing = options();
  refreshing.refreshInterval = 5ms;
  VeskReporting session(refreshing);
  EXPECT_EQ(session.setSessionInfo(sessionInfo), ReportingStatus::Queued);
  EXPECT_EQ(session.startConfig(ReportingCallback<BackendNamesAnswer>()), ReportingStatus::Queued);
  while (record.count("startConfig") < 2) std::this_thread::yield();
}

}  // namespace
}  // namespace vesk::test
