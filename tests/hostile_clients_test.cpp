// Many clients, and clients that send nonsense, against the real daemon.
#include <gtest/gtest.h>

#include <limits>

#include "platform/service/DescriptorLimit.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/IPCHarness.h"
#include "tests/support/ProcessFacts.h"

namespace vesk::test {
namespace {

using namespace std::string_view_literals;

/// Kept connections of the HTTP client, whose number varies.
constexpr std::size_t kSpareDescriptors = 8;

/// Checks that the daemon's resources are back to their previous level, and that it still serves clients.
class Aftermath {
 public:
  explicit Aftermath(DaemonHarness& harness) : _harness(harness), _facts(harness.daemon().pid()) {
    {
      RoadClient client(_harness);  // creates everything that is created once
      EXPECT_TRUE(client.reporting.sendMessageAndWait(message(8)));
      harness.waitForEventsOfMethod(8, 1);
      _threads = _facts.threads() - 1;  // without this client's thread
      _descriptors = _facts.descriptors();
    }
    EXPECT_TRUE(eventually([&] { return _facts.threads() <= _threads; })) << "its place is free again";
  }
  void expectNothingLeft() {
    EXPECT_TRUE(eventually([&] { return _facts.threads() <= _threads; })) << _facts.threads();
    EXPECT_TRUE(eventually([&] { return _facts.descriptors() <= _descriptors + kSpareDescriptors; }))
        << _facts.descriptors();
    RoadClient client(_harness);
    EXPECT_TRUE(client.reporting.sendMessageAndWait(message(9)));
    _harness.waitForEventsOfMethod(9, 1);
    EXPECT_EQ(_harness.stopDaemon(), 0);
  }

 private:
  DaemonHarness& _harness;
  ProcessFacts _facts;
  std::size_t _threads = 0;
  std::size_t _descriptors = 0;
};

/// Makes `count` connections as `user` and keeps those that are accepted.
void connect(const DaemonHarness& harness, uid_t user, int count, std::vector<RawClient>& open) {
  ASSERT_EQ(::seteuid(user), 0);
  for (int i = 0; i < count; ++i) {
    RawClient client(harness.socketPath());
    client.send("\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"sv);
    if (client.line() == "DATA") open.push_back(std::move(client));
  }
  ASSERT_EQ(::seteuid(::getuid()), 0);
}

TEST(HostileClients, AFloodOfWarningsIsCutShortWithTheNumberLeftOut) {
  for (std::size_t limit : {200, 0, 7}) {
    DaemonHarness harness;
    if (limit != 200) harness.setPreference("logRateLimit", std::to_string(limit));
    harness.startDaemon({"--log-level", "6"});
    {
      RoadClient client(harness);
      MutableDictionary wide;
      for (int i = 0; i < 1000; ++i) wide.append(Text(std::to_string(i)), Bytes(std::string(1, 'x')));
      EXPECT_TRUE(client.reporting.sendMessageAndWait(message(3, wide.share())));
      harness.waitForEventsOfMethod(3, 1);
    }
    EXPECT_EQ(harness.stopDaemon(), 0);
    const std::string log = harness.daemon().errors();
    std::size_t lines = 0;
    for (std::size_t at = 0; (at = log.find("unable to handle key: ", at)) != log.npos; ++at) ++lines;
    EXPECT_EQ(lines, limit > 0 ? limit + 1 : 1000) << "with the one that tells the number";
    const std::string last = "log: Left out " + std::to_string(1000 - limit) + " lines of user ";
    EXPECT_EQ(log.find(last) != log.npos, limit > 0);
  }
}

const std::vector<Value> kStrangeValues{"text",
                                        "",
                                        "-9223372036854775809",
                                        -1,
                                        std::numeric_limits<std::int64_t>::min(),
                                        std::uint64_t{1} << 63,
                                        std::numeric_limits<std::uint64_t>::max(),
                                        std::numeric_limits<double>::quiet_NaN(),
                                        std::numeric_limits<double>::infinity(),
                                        -std::numeric_limits<double>::infinity(),
                                        1e300,
                                        true,
                                        Value(),
                                        Bytes("bytes"),
                                        Date{std::numeric_limits<double>::infinity()},
                                        List{1, "two"},
                                        Dictionary{{"a", 1}},
                                        [] {
                                          MutableDictionary wide;
                                          for (int i = 0; i < 10'000; ++i) wide.set(std::to_string(i), i);
                                          return wide.share();
                                        }()};

Dictionary with(const Dictionary& base, const char* key, const Value& value) {
  MutableDictionary changed(base);
  changed.set(key, value);
  return changed.share();
}

TEST(HostileClients, EveryKindOfValueInEveryNumericKeyHarmsNobody) {
  DaemonHarness harness;
  harness.startDaemon({"--log-level", "6"});
  Aftermath aftermath(harness);
  std::optional<RoadClient> other(std::in_place, harness);
  const Dictionary info{{kVeskReportingSessionInfoSessionID, 7},
                        {kVeskReportingSessionInfoClientType, 5},
                        {kVeskReportingSessionInfoClientVersion, 3}};
  for (const Value& value : kStrangeValues) {
    SCOPED_TRACE(describe(value));
    for (const char* key : {kVeskReportingSessionInfoSessionID, kVeskReportingSessionInfoClientType,
                            kVeskReportingSessionInfoClientVersion, kVeskReportingSessionInfoRequireUserInfo,
                            kVeskReportingSessionInfoBatchEvent}) {
      VeskReporting session(harness.clientOptions());
      ASSERT_EQ(session.setSessionInfo(with(info, key, value), Dictionary{{key, value}}),
                ReportingStatus::Queued);
      EXPECT_TRUE(session.startConfig(ChildProcess::kPatience)) << key;
      EXPECT_TRUE(session.sendMessageAndWait(message(3))) << key;
      EXPECT_TRUE(session.fetchStates(Dictionary{{"clientName", value}})) << key;
      EXPECT_TRUE(session.flushMessagesAndWait()) << key;
      EXPECT_TRUE(session.fetchDisplayURL()) << key;
      // It may be accepted or refused, but it must be answered.
      EXPECT_NE(session.sendMessageOnceAndWait(with(info, key, value), std::nullopt, 3, 2).status,
                ReportingStatus::NotConnected)
          << key;
    }
    for (const char* key : {"category", "type", "flag", "payload"}) {
      EXPECT_TRUE(other->reporting.sendMessageAndWait(with(message(4), key, value))) << key;
    }
    EXPECT_TRUE(other->reporting.sendMessageAndWait(5, 2, Dictionary{{"value", value}}));
  }
  // One event for each value, regardless of what happened to the value itself.
  harness.waitForEventsOfMethod(5, kStrangeValues.size());
  other.reset();
  aftermath.expectNothingLeft();
}

}  // namespace
}  // namespace vesk::test
