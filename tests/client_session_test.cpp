#include <csignal>
#include <future>

#include "tests/support/ClientHarness.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

const Dictionary kUserInfo{{kVeskReportingUserInfoClientName, "tester"}};

class ClientSession : public ClientHarness {
 protected:
  ClientSession() { daemon.emplace(socket, record); }
};

/// A callback that fulfils a future.
template <class Answer>
struct Caught {
  std::promise<ReportingResult<Answer>> promise;
  std::future<ReportingResult<Answer>> future = promise.get_future();

  ReportingCallback<Answer> callback() {
    return [this](ReportingResult<Answer> result) { promise.set_value(std::move(result)); };
  }
  ReportingResult<Answer> get() {
    if (future.wait_for(1min) != std::future_status::ready)
      return {ReportingStatus::OutOfResources, {}, "never called"};
    return future.get();
  }
};

TEST_F(ClientSession, TheShortFormRequiresUserInfo) {
  VeskReporting session(options());
  EXPECT_EQ(session.setSessionInfo(ReportingSession{.clientType = 5, .clientName = "Camera"}),
            ReportingStatus::Queued);
  EXPECT_TRUE(record.waitFor(
      R"(setSessionInfo {"sessionID": 0, "clientType": 5, "clientVersion": 0, "requireUserInfo": true, )"
      R"("batchEvent": false} {"clientName": "Camera"} [])"));
}

TEST_F(ClientSession, TellsTheDaemonEveryOperationAndGetsItsAnswers) {
  auto file = directory.write("some file.txt", "contents");
  VeskReporting session(options());
  EXPECT_EQ(session.setSessionInfo(sessionInfo, kUserInfo, {"Calls", "Media"}), ReportingStatus::Queued);
  EXPECT_EQ(session.startConfig().answer, (BackendNames{"httpPost", "wren"}));
  EXPECT_EQ(session.fetchStates(kUserInfo).answer, (BackendNames{"httpPost", "wren"}));
  EXPECT_EQ(session.fetchDisplayURL().answer, "https://display.example/");
  EXPECT_EQ(session.sendMessageAndWait(1, 2, Dictionary{{"k", "v"}}).answer, "posted");
  auto silent = session.sendMessageAndWait(Dictionary{{"category", 5}});
  EXPECT_EQ(silent.status, ReportingStatus::Done);
  EXPECT_EQ(silent.answer, std::nullopt);
  EXPECT_EQ(session.flushMessagesAndWait().answer, "posted all");
  EXPECT_TRUE(session.uploadFile(file).answer);
  EXPECT_TRUE(session.uploadLogData({"line", 2}).answer);
  EXPECT_EQ(session.sendMessageOnceAndWait(sessionInfo, std::nullopt, 3, 4).answer, "finished");

  const std::string info = describe(sessionInfo), user = describe(kUserInfo);
  EXPECT_EQ(record.lines(),
            (std::vector<std::string>{
                "setSessionInfo " + info + " " + user + " [\"Calls\", \"Media\"]", "startConfig",
                "fetchStates " + user, "fetchDisplayURL", "message 1 2 {\"k\": \"v\"}",
                "parameters {\"category\": 5}", "flush",
                "uploadFile file://" + directory.path().string() + "/some%20file.txt contents",
                "uploadLogData [\"line\", 2]", "messageOnce " + info + " none 3 4 none"}));
}

TEST_F(ClientSession, AnswersThroughCallbacksInTheOrderOfTheCalls) {
  auto file = directory.write("file", "contents");
  std::vector<std::pair<int, ReportingStatus>> ends, expected;
  auto note = [&](int index) {
    return [&ends, index](auto result) { ends.emplace_back(index, result.status); };
  };
  {
    VeskReporting session(options());
    for (auto status : {session.startConfig(note(0)), session.fetchStates(std::nullopt, note(1)),
                        session.fetchDisplayURL(note(2)), session.sendMessage(1, 2, std::nullopt, note(3)),
                        session.sendMessage(Dictionary{{"type", 1}}, note(4)), session.flushMessages(note(5)),
                        session.uploadFile(file, note(6)), session.uploadLogData({}, note(7)),
                        session.sendMessageOnce(sessionInfo, kUserInfo, 1, 2, std::nullopt, note(8))}) {
      EXPECT_EQ(status, ReportingStatus::Queued);
      expected.emplace_back(static_cast<int>(expected.size()), ReportingStatus::Done);
    }
  }
  EXPECT_EQ(ends, expected);
}

TEST_F(ClientSession, HandsAggregatedMessagesToTheHandler) {
  Caught<AggregatedMessage> first, closing;
  VeskReporting session(options());
  auto handler = [&](const AggregatedMessage& message) {
    (message.isClosing() ? closing : first).promise.set_value({ReportingStatus::Done, message, {}});
    if (message.isClosing()) throw std::runtime_error("handlers should not");
  };
  EXPECT_EQ(session.setSessionInfo(sessionInfo, std::nullopt, {}, handler), ReportingStatus::Queued);
  EXPECT_TRUE(session.startConfig());
  EXPECT_TRUE(record.lines().front().ends_with(" aggregating"));

  daemon->sendToClient(sessionInfo, 12.5, 3, 4, Dictionary{{"k", 1}});
  daemon->sendToClient(std::nullopt, 0, 0, 0, std::nullopt);
  auto [arrived, message, detail] = first.get();
  ASSERT_EQ(arrived, ReportingStatus::Done) << testing::PrintToString(record.lines());
  EXPECT_EQ(message.sessionInfo, sessionInfo);
  EXPECT_EQ(message.timestamp, 12.5);
  EXPECT_EQ(message.category, 3);
  EXPECT_EQ(message.type, 4);
  EXPECT_EQ(message.payload, (Dictionary{{"k", 1}}));
  EXPECT_TRUE(closing.get()) << testing::PrintToString(record.lines());
  EXPECT_TRUE(session.startConfig()) << "an exception ended the session";
}

TEST_F(ClientSession, CallbacksMayUseTheSessionButNotWait) {
  Caught<ReportingStatus> inner;
  sigset_t blocked;
  VeskReporting session(options());
  EXPECT_EQ(session.startConfig([&](const auto&) {
    ::pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
    auto sent = session.sendMessage(1, 1);
    auto waited = session.fetchDisplayURL().status;
    inner.promise.set_value({sent, waited, {}});
  }),
            ReportingStatus::Queued);
  auto result = inner.get();
  EXPECT_EQ(result.status, ReportingStatus::Queued);
  EXPECT_EQ(result.answer, ReportingStatus::OnSessionThread);
  EXPECT_TRUE(sigismember(&blocked, SIGTERM)) << "signals are the host's";
  EXPECT_FALSE(sigismember(&blocked, SIGSEGV)) << "faults are the callback's";
  EXPECT_TRUE(record.waitFor("message 1 1"));
}

TEST_F(ClientSession, TellsWhyThereIsNoAnswer) {
  VeskReporting session(options());
  record.abandonsAnswers = true;
  EXPECT_EQ(session.fetchDisplayURL().status, ReportingStatus::Refused);
  record.abandonsAnswers = false;
  record.holdsAnswers = true;
  EXPECT_EQ(session.fetchDisplayURL(20ms).status, ReportingStatus::TimedOut);
  Caught<std::string> late;
  EXPECT_EQ(session.fetchDisplayURL(late.callback(), 20ms), ReportingStatus::Queued);
  EXPECT_EQ(late.get().status, ReportingStatus::TimedOut);
  record.release();
}

TEST_F(ClientSession, RefusesWhatCannotBeSentAndGoesOn) {
  VeskReporting session(options());
  EXPECT_EQ(session.sendMessageAndWait(1, 1, Dictionary{{"k", std::string(2'000'000, 'x')}}).status,
            ReportingStatus::InvalidArgument);
  EXPECT_EQ(session.uploadLogData(List(std::vector<Value>(90'000, Date{}))).status,
            ReportingStatus::InvalidArgument)
      << "too long on the wire only";
  EXPECT_EQ(session.sendMessage(1, 1, Dictionary{{"k", "\xff"}}), ReportingStatus::InvalidArgument);
  EXPECT_EQ(session.setSessionInfo(sessionInfo, Dictionary{{"k", "\xff"}}), ReportingStatus::InvalidArgument)
      << "or the session would go on as what it was";
  EXPECT_EQ(session.fetchStates(Dictionary{{"k", "\xff"}}, nullptr), ReportingStatus::InvalidArgument);
  EXPECT_EQ(session.sendMessageAndWait(1, 2).answer, "posted");
  EXPECT_EQ(session.drops().invalid, 5U);
  EXPECT_EQ(session.uploadFile(directory / "missing").status, ReportingStatus::FileUnavailable);
  EXPECT_EQ(session.uploadFile(directory.path()).detail, "Is a directory");
}

TEST_F(ClientSession, TheEndOfASessionSendsWhatIsQueuedAndCollectsItsAnswers) {
  constexpr std::uint16_t kMessages = 1000;
  const Dictionary payload{{"k", std::string(2000, 'x')}};  // in total more than the socket takes at once
  int answers = 0;
  {
    auto endless = options();
    endless.drainTime = std::chrono::milliseconds::max();
    VeskReporting session(endless);
    for (std::uint16_t i = 0; i < kMessages; ++i) {
      EXPECT_EQ(session.sendMessage(i, 0, payload), ReportingStatus::Queued);
      EXPECT_EQ(session.sendMessage(i, 1, payload, [&](auto result) { answers += result ? 1 : 0; }),
                ReportingStatus::Queued);
    }
  }
  EXPECT_EQ(answers, kMessages);
  auto lines = record.lines();
  ASSERT_EQ(lines.size(), 2U * kMessages);
  for (std::size_t i = 0; i < lines.size(); ++i) {
    std::string beginning = "message " + std::to_string(i / 2) + " " + std::to_string(i % 2) + " ";
    EXPECT_TRUE(lines[i].starts_with(beginning)) << lines[i];
  }
}

TEST_F(ClientSession, TheEndOfASessionDoesNotWaitForAnAnswerLongerThanItsTime) {
  record.holdsAnswers = true;
  Caught<std::string> owed;
  {
    auto shortDrain = options();
    shortDrain.drainTime = 20ms;
    VeskReporting session(shortDrain);
    EXPECT_EQ(session.fetchDisplayURL(owed.callback()), ReportingStatus::Queued);
    ASSERT_TRUE(record.waitFor("fetchDisplayURL"));
  }
  EXPECT_EQ(owed.get().status, ReportingStatus::Closed);
}

}  // namespace
}  // namespace vesk::test
