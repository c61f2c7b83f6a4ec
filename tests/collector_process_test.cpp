#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>

#include "tests/support/ChildProcess.h"
#include "tests/support/TempDirectory.h"
#include "tests/support/WebRequest.h"
#include "tools/json/JSONReader.h"

namespace vesk {
namespace {

using test::ChildProcess;
using test::TempDirectory;
using test::WebClient;

const std::vector<std::string> kPostHeaders{"Accept: application/json", "Content-Type: application/json",
                                            "X-Vesk-Sender: HD"};
constexpr char kPost[] = R"({"postTime":1,"clientId":"c","events":[{"_method":3,"user":"mail"}]})";

class CollectorProcess : public ::testing::Test {
 protected:
  ChildProcess::Options options(std::vector<std::string> further = {}) const {
    ChildProcess::Options options;
    options.command = {VESK_COLLECTOR, "--directory", _files / "collector", "--ready-file",
                       _files / "ready.json"};
    for (const char* port : {"--https-port", "--http-port", "--udp-port"})
      if (std::ranges::count(further, port) == 0) options.command.insert(options.command.end(), {port, "0"});
    options.command.insert(options.command.end(), further.begin(), further.end());
    return options;
  }
  /// Waits until it listens, and reads its addresses.
  void waitUntilReady() {
    ASSERT_TRUE(test::eventually([&] { return std::filesystem::exists(_files / "ready.json"); }));
    _facts = *parseJSON(_files.read("ready.json"))->dictionary();
  }
  std::string fact(const char* key) const {
    auto text = _facts.text(key);
    return text ? text->string() : describe(*_facts.find(key));
  }

  TempDirectory _files;
  Dictionary _facts;
};

TEST_F(CollectorProcess, WritesOneJSONLineAnEventAndNothingElseOnItsOutput) {
  ChildProcess collector(options({"--json", "--fault", "post=empty-body"}));
  waitUntilReady();
  EXPECT_EQ(WebClient(fact("authorityFile")).post(fact("eventsURL"), kPost, kPostHeaders).body, "");
  EXPECT_TRUE(collector.waitForText("\"user\":\"mail\""));
  collector.signal(SIGINT);
  EXPECT_EQ(collector.wait(), 0);
  EXPECT_NE(collector.errors().find("events taken: 1, posts: 1, repeated events left out: 0"),
            std::string::npos);
  auto line = parseJSON(collector.output());
  ASSERT_TRUE(line) << line.error().text;
  EXPECT_EQ(line->dictionary()->dictionary("headers")->text("X-Vesk-Sender"), "HD");
}

TEST_F(CollectorProcess, TellsUsageFromFailure) {
  ChildProcess first(options());
  waitUntilReady();
  const struct {
    std::vector<std::string> arguments;
    int status;
    std::string text;
  } cases[] = {
      {{"--help"}, 0, "--fault"},
      {{"--version"}, 0, "veskcollector "},
      {{"--fault", "post=often"}, 2, "unknown fault 'often'"},
      {{"--address", "192.0.2.1"}, 1, "can't listen on 192.0.2.1"},
      {{"--storebags", "/proc/none"}, 1, "/proc/none"},
      {{"--http-port", fact("httpPort")},
       1,
       "can't listen on 127.0.0.1: port " + fact("httpPort") + " is in use\n"},
      {{"--udp-port", fact("udpPort")},
       1,
       "can't listen on 127.0.0.1: UDP port " + fact("udpPort") + " is in use\n"},
  };
  for (const auto& test : cases) {
    ChildProcess collector(options(test.arguments));
    EXPECT_EQ(collector.wait(), test.status) << test.text;
    EXPECT_NE((collector.output() + collector.errors()).find(test.text), std::string::npos) << test.text;
  }
}

}  // namespace
}  // namespace vesk
