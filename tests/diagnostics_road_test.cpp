// What an operator is told about the real daemon: its status, and why a client's messages are reported or
// not.
#include <gtest/gtest.h>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

class DiagnosticsRoad : public testing::Test {
 protected:
  struct Told {
    int status;
    std::string text;
  };
  Told ask(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin() + 1, {"--root", harness.root.path().string()});
    arguments.insert(arguments.begin(), VESK_BIN_DIRECTORY "/veskreport");
    ChildProcess tool(std::move(arguments));
    const int status = tool.wait().value_or(-1);
    return {status, tool.output() + tool.errors()};
  }
  RoadClient session(const char* name) {
    return RoadClient(harness, Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}},
                      Dictionary{{kVeskReportingUserInfoClientName, name}});
  }
  void start(const std::string& bag) {
    harness.writeStorebag("zelko",
                          "version = \"7\"\n[[release.httpPost.clients]]\nclient = \"Camera\"\n" + bag);
    harness.startDaemon();
  }
  static bool contains(const std::string& text, const std::string& part) {
    return text.find(part) != text.npos;
  }

  DaemonHarness harness;
};

constexpr char kReports[] =
    "locale_whitelist = [\"US\"]\nsampling_threshold = 1.0\npost_url = \"@EVENTS@\"\n"
    "[[release.httpPost.clients.filters]]\nkey = \"x\"\naction = \"remove\"\n";

TEST_F(DiagnosticsRoad, StatusTellsWhatIsReportedAndWhatIsWrong) {
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
        "  httpPost: enabled\n", "  httpPost: disabled, since no client entry is for 'Nobody'\n"}) {
    EXPECT_TRUE(contains(told.text, part)) << part << "\n" << told.text;
  }
  EXPECT_TRUE(contains(ask({"status", "--openmetrics"}).text, "veskreporting_sessions 2\n"));

  harness.stopCollector();
  EXPECT_TRUE(session("Camera").reporting.sendMessageAndWait(message(3, {}, 1)));
  ASSERT_TRUE(eventually([&] { return ask({"status"}).status == 1; })) << "when the post is put aside";
  told = ask({"status", "--json"});
  const auto status = boost::json::parse(told.text).as_object();
  EXPECT_EQ(status.at("health"), "degraded");
  EXPECT_GE(status.at("outbox").at("posts").as_int64(), 1);
  EXPECT_TRUE(contains(told.text, "posts wait for https://")) << told.text;
}

TEST_F(DiagnosticsRoad, ExplainGivesTheReasonThatTheDaemonActsUpon) {
  const struct {
    const char* bag;
    const char* name;
    const char* reason;  ///< of both, or "enabled"
  } cases[] = {
      {kReports, "Camera", "enabled"},
      {kReports, "Nobody", "no client entry is for 'Nobody'"},
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
  harness.setPreference("diagnosticsSubmission", "false");
  start(kReports);
  const auto client = session("Camera");
  for (const auto& told :
       {ask({"status"}), ask({"explain", "--client-type", "5", "--client-name", "Camera"})}) {
    EXPECT_TRUE(contains(told.text, "httpPost: disabled, since the user did not agree")) << told.text;
  }
}

}  // namespace
}  // namespace vesk::test
