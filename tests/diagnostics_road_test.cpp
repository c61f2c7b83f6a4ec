// What an operator is told about the real daemon: its status, and why a client's messages are reported or
// not.
#include <gtest/gtest.h>

#include <set>
#include <tuple>

#include "platform/json/JSONWriter.h"
#include "tests/support/OperatorTest.h"
#include "tests/support/RandomEntries.h"

namespace vesk::test {
namespace {

using Diagnostics = OperatorTest;

TEST_F(Diagnostics, StatusTellsWhatIsReportedAndWhatIsWrong) {
  EXPECT_EQ(ask({"status"}).status, 1);
  EXPECT_TRUE(contains(ask({"status"}).text, "is veskreportingd running?"));
  start(kReports);
  auto told = ask({"explain", "--client-type", "5"});
  EXPECT_EQ(told.status, 1);
  EXPECT_TRUE(contains(told.text, "the storebag 'zelko' was not fetched yet")) << told.text;
  const auto camera = session("Camera"), nobody = session("Nobody");
  told = ask({"status"});
  EXPECT_EQ(told.status, 0) << told.text;
  for (const char* part :
       {": ok, up ", "storebag zelko: current, version 7", "client type 5 Camera (user ",
        "  httpPost: enabled\n", "  httpPost: disabled, since client 'Nobody' is in no entry\n"}) {
    EXPECT_TRUE(contains(told.text, part)) << part << "\n" << told.text;
  }
  EXPECT_TRUE(contains(ask({"status", "--openmetrics"}).text, "veskreporting_sessions 2\n"));

  harness.stopCollector();
  EXPECT_TRUE(session("Camera").reporting.sendMessageAndWait(message(3, {}, 1)));
  ASSERT_TRUE(eventually([&] { return ask({"status"}).status == 1; })) << "when the post is put aside";
  told = ask({"status", "--json"});
  const auto status = boost::json::parse(told.text).as_object();
  EXPECT_EQ(status.at("health"), "degraded");
  const auto bag = status.at("storebags").at(0).as_object();
  EXPECT_TRUE(contains(std::string(bag.at("origin").as_string()), "/bags/sorrel/zelko?version="));
  EXPECT_EQ(bag.at("key").as_string().size(), 16u);
  const auto setting = status.at("settings").at("environmentType").as_object();
  EXPECT_EQ(setting.at("value"), 4);
  EXPECT_TRUE(contains(std::string(setting.at("file").as_string()), "/etc/veskreporting/preferences/com."));
  EXPECT_GE(status.at("outbox").at("posts").as_int64(), 1);
  EXPECT_TRUE(contains(told.text, "posts wait for https://")) << told.text;
}

TEST_F(Diagnostics, ExplainGivesTheReasonThatTheDaemonActsUpon) {
  const struct {
    const char* bag;
    const char* name;
    const char* reason;  ///< of both, or "enabled"
  } cases[] = {
      {kReports, "Camera", "enabled"},
      {kReports, "Nobody", "client 'Nobody' is in no entry"},
      {"sampling_threshold = 1.0\nfilters = []\n", "Camera", "the entry has no locale_whitelist"},
      {"locale_whitelist = [\"FR\", \"DE\"]\nfilters = []\n", "Camera",
       "the region 'US' is not among 'FR', 'DE'"},
      {"locale_whitelist = [\"US\"]\ndevice_whitelist = [\"Watch\"]\n", "Camera", "is not among 'Watch'"},
      {"locale_whitelist = [\"US\"]\n", "Camera", "the entry has no filters"},
      {"locale_whitelist = [\"US\"]\nfilters = []\n", "Camera", "the entry has no sampling_threshold"},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.reason);
    start(test.bag);
    const auto client = session(test.name);
    const std::string state = std::string(test.reason) == "enabled" ? "" : "disabled, since ";
    for (const auto& told :
         {ask({"status"}), ask({"explain", "--client-type", "5", "--client-name", test.name})}) {
      EXPECT_TRUE(contains(told.text, "httpPost: " + state)) << told.text;
      EXPECT_TRUE(contains(told.text, test.reason)) << told.text;
    }
    const auto told = ask({"explain", "--client-type", "5", "--client-name", test.name});
    const bool isEnabled = state.empty();
    EXPECT_EQ(contains(told.text, "  posts to https://"), isEnabled) << told.text;
    EXPECT_EQ(contains(told.text, "  reports for 100 % of the sessions"), isEnabled) << told.text;
    EXPECT_EQ(harness.stopDaemon(), 0);
  }
  start(kReports);
  { session("Camera"); }  // fetches the storebag
  auto asked = ask({"explain", "--client-type", "5", "--client-name", "Camera", "x=secret", "y:=1"});
  EXPECT_TRUE(contains(asked.text, "  x is removed\n  y leaves as it is\n")) << asked.text;
  asked = ask({"explain", "--client-type", "5", "--client-name", "Camera", "--device", "RegionCode=FR"});
  EXPECT_TRUE(contains(asked.text, "the region 'FR' is not among 'US'")) << asked.text;
  EXPECT_EQ(harness.stopDaemon(), 0);
  harness.setPreference("diagnosticsSubmission", "false");
  start(kReports);
  const auto client = session("Camera");
  for (const auto& told :
       {ask({"status"}), ask({"explain", "--client-type", "5", "--client-name", "Camera"})}) {
    EXPECT_TRUE(contains(told.text, "httpPost: disabled, since the user did not agree")) << told.text;
  }
}

TEST_F(Diagnostics, SendTellsWhatBecameOfTheMessage) {
  start(kReports + std::string("[release.dashboard]\nip = \"127.0.0.1\"\nport = @UDPPORT@\nreliable = 50\n"));
  const std::vector<std::string> camera{"send", "--client-type", "5", "-c", "3", "-t", "1", "--client-name"};
  const auto send = [&](const std::string& name, std::vector<std::string> more = {}) {
    auto arguments = camera;
    arguments.push_back(name);
    arguments.insert(arguments.end(), more.begin(), more.end());
    return ask(arguments);
  };
  const struct {
    const char* name;
    std::vector<std::string> more;
    int status;
    std::vector<std::string> told;
  } cases[] = {
      {"Camera", {}, 0, {"httpPost: sent\n", "dashboard: sent\n"}},
      {"Camera", {"--batch"}, 0, {"httpPost: held until a flush\n", "dashboard: sent\n"}},
      {"Nobody", {}, 0, {"httpPost: dropped: client 'Nobody' is in no entry (storebag 7)\n"}},
      {"Nobody", {"--no-require-user-info"}, 0, {"httpPost: sent", "asks neither consent, client entry"}},
      {"Camera", {"--json"}, 0, {R"("httpPost":{"outcome":"sent","cause":""})"}},
  };
  for (const auto& test : cases) {
    const auto told = send(test.name, test.more);
    EXPECT_EQ(told.status, test.status) << told.text;
    for (const auto& part : test.told) EXPECT_TRUE(contains(told.text, part)) << part << "\n" << told.text;
  }
  EXPECT_EQ(ask({"send", "--client-type", "5", "-c", "3", "-t", "1"}).status, 2) << "without user info";
  harness.stopCollector();
  EXPECT_TRUE(contains(send("Camera", {"--no-wait"}).text, "httpPost: deferred: ")) << "after some seconds";
}

TEST_F(Diagnostics, TheLogTellsWhatAnOperatorHasToMend) {
  harness.setPreference("keepStorebag", "true");
  harness.setDeviceFact("Regioncode", "\"US\"");
  std::filesystem::remove(harness.root / "usr/share/veskreporting/publicKey.der");
  start(kReports);
  for (const char* type : {"5", "99", "9"}) {  // of the last, the server has no storebag
    EXPECT_EQ(ask({"send", "--client-type", type, "-c", "1", "-t", "1", "--client-name", "Camera"}).status,
              1);
  }
  EXPECT_EQ(harness.stopDaemon(), 0);
  std::string log = harness.daemon().errors();
  for (const char* line :
       {"nothing reads the key 'keepStorebag'; is 'keepStorebags' meant?",
        "nothing reads the key 'Regioncode'; is 'RegionCode' meant?",
        "<4> storebagForSession: there is no usable public key at ",
        "<4> storebagForSession: no storebag is for client type 99",
        "<4> storebagForSession: the storebag server answered with status 404 for client type 9"}) {
    EXPECT_TRUE(contains(log, line)) << line;
  }
}

TEST_F(Diagnostics, SendFailsIfAllIsDropped) {
  start(kReports);
  auto told = ask({"send", "--client-type", "5", "-c", "3", "-t", "1", "--client-name", "Nobody"});
  EXPECT_EQ(told.status, 1);
  EXPECT_EQ(told.text, "veskreport: dropped: httpPost: client 'Nobody' is in no entry (storebag 7)\n");
  EXPECT_TRUE(harness.daemon().waitForText(
      "<4> HTTPSPostBackend(updateBackendState): httpPost reports nothing: client 'Nobody' is in no entry"));
  ChildProcess stream(ChildProcess::Options{
      .command = {VESK_BIN_DIRECTORY "/veskreport", "send", "--root", harness.root.path().string(),
                  "--client-type", "5", "--client-name", "Nobody", "-c", "3", "-t", "1", "--stdin"},
      .input = "{}\n{}\n{}\n"});
  EXPECT_EQ(stream.wait(), 1);
  EXPECT_EQ(stream.output(), "3 messages sent, 3 dropped (httpPost: client 'Nobody' is in no entry)\n");
  told = ask({"states", "--client-type", "5", "--client-name", "Camera"});
  EXPECT_EQ(told.text, "httpPost\n");
  EXPECT_EQ(ask({"states", "--client-type", "5", "--client-name", "Nobody", "--json"}).text,
            "{\"status\":\"done\",\"backends\":[]}\n");
}

TEST_F(Diagnostics, TapShowsWhatLeavesTheDevice) {
  start(kReports);
  ChildProcess tap({VESK_BIN_DIRECTORY "/veskreport", "tap", "--root", harness.root.path().string(),
                    "--client-name", "Camera", "--messages", "--bodies", "--count", "6"});
  ASSERT_TRUE(tap.waitForText("watching"));
  {
    auto nobody = session("Nobody");  // filtered out
    auto camera = session("Camera");
    EXPECT_TRUE(camera.reporting.sendMessageAndWait(message(3, {{"x", "secret"}, {"y", 1}})));
  }
  EXPECT_EQ(tap.wait(), 0);
  const std::string text = tap.output();
  for (const char* part : {"httpPost: message 3/2 posted [client type 5 Camera, session 77]\n",
                           "httpPost: post of 1 delivered, status 200, https://", "\"y\":1"}) {
    EXPECT_TRUE(contains(text, part)) << part << "\n" << text;
  }
  EXPECT_FALSE(contains(text, "secret")) << "it is shown as it was sent, after the filters";
  EXPECT_FALSE(contains(text, "Nobody"));
}

// The daemon's own draws are not known, so the thresholds let all sessions through or none.
TEST_F(Diagnostics, ExplainTellsWhatTheDaemonThenDoes) {
  RandomEntries random(3);
  int enabled = 0;
  for (const auto& [device, region, consent] : {std::tuple("Phone", "US", "true"),
                                                {"Watch", "FR", "true"},
                                                {"Phone", "US", "false"},
                                                {"Tablet", "US", "true"}}) {
    MutableDictionary storebag(Dictionary{{"version", "7"}});
    std::vector<Value> entries;
    for (int i = 0; i < 26; ++i)
      entries.emplace_back(
          random.entry("C" + std::to_string(i), "@EVENTS@", {-1.0, 1.0, 1.0, 1.0, 1.0, 1.0}));
    storebag.set("release", Dictionary{{"httpPost", Dictionary{{"clients", List(std::move(entries))}}}});
    harness.writeStorebag("zelko", *toJSON(storebag.share(), JSONStyle::Compact), ".json");
    harness.setDeviceFact("DeviceName", "\"" + std::string(device) + "\"");
    harness.setDeviceFact("RegionCode", "\"" + std::string(region) + "\"");
    harness.setPreference("diagnosticsSubmission", consent);
    harness.startDaemon();
    { session("C0"); }  // fetches the storebag
    const std::size_t before = harness.waitForEvents([](const auto&) { return true; }).size();
    std::set<std::string> expected;
    for (int i = 0; i < 26; ++i) {
      const std::string name = "C" + std::to_string(i);
      SCOPED_TRACE(std::string(device) + " " + name);
      const auto told = ask({"explain", "--client-type", "5", "--client-name", name, "--json"});
      const auto backend = boost::json::parse(told.text).at("backends").at("httpPost").as_object();
      auto client = session(name.c_str());
      const bool isEnabled = client.enabled && client.enabled->size() == 1;
      EXPECT_EQ(isEnabled, backend.at("state") == "enabled") << told.text;
      if (isEnabled && backend.contains("postURL")) expected.insert(name);
      enabled += isEnabled ? 1 : 0;
      EXPECT_TRUE(client.reporting.sendMessageAndWait(message(3, {{"case", name}, {"x", 1}})));
      EXPECT_TRUE(client.reporting.flushMessagesAndWait(ChildProcess::kPatience));
    }
    EXPECT_EQ(harness.stopDaemon(), 0);
    std::set<std::string> arrived;
    const auto events = harness.waitForEvents([](const auto&) { return true; });
    for (std::size_t i = before; i < events.size(); ++i) {
      const auto& event = events[i].at("event").as_object();
      if (event.contains("case")) arrived.emplace(event.at("case").as_string());
    }
    EXPECT_EQ(arrived, expected) << device;
  }
  EXPECT_GT(enabled, 20) << "of 104";
}

}  // namespace
}  // namespace vesk::test
