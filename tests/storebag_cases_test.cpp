// Decisions about a storebag without a daemon: `veskreport storebag test` and `explain --storebag`.
#include <gtest/gtest.h>

#include "tests/support/DaemonHarness.h"
#include "tests/support/Veskreport.h"

namespace vesk::test {
namespace {

constexpr char kStorebag[] = R"(
[release.httpPost2]
clients = []
[release.wren]
[release.dashboard]
ip = "127.0.0.1"
[[release.httpPost.clients]]
client = "Camera"
locale_whitelist = ["US"]
sampling_threshold = 0.5
post_url = "https://collect.example/events"
filters = [{key = "user", action = "sha256"}, {key = "password", action = "remove"}, {key = "lens", method = 4, action = "remove"}]
)";

constexpr char kReported[] =
    "client = \"Camera\"\npayload = {user = \"ann\", password = \"p\", lens = \"wide\", n = 3}\n";

struct Case {
  std::string toml;  // of the case, or of the whole document if it has a [[case]] of its own
  const char* says;  // "" if the case holds
};

TEST(StorebagTest, SaysWhichExpectationsDoNotHold) {
  const std::string reported = kReported;
  const Case cases[] = {
      {reported +
           "expect = {state = \"enabled\", url = \"https://collect.example/events\", removed = "
           "[\"password\"], "
           "fields = {n = 3.0, lens = \"wide\", user = {sha256 = \"ann\"}, _sender = \"HD\", _internal = 0}}",
       ""},
      {reported + "category = 4\nexpect = {removed = [\"lens\"]}", ""},
      {reported + "backend = \"httpPost2\"\nexpect = {state = \"disabled\"}", ""},
      {reported + "backend = \"dashboard\"\nexpect = {state = \"absent\"}", ""},
      {"client = {requireUserInfo = false, type = 9}\nexpect = {state = \"enabled\", fields = {_sender = "
       "\"FX\"}}",
       ""},
      {"client = {clientName = \"Camera\", draw = 0.6}\nexpect = {state = \"override\"}", ""},
      {"backend = \"wren\"\nexpect = {state = \"enabled\"}", ""},
      {"backend = \"wren\"\ndevice = {ProductType = \"Bramble\"}\nexpect = {state = \"absent\"}", ""},
      {reported + "device = {environment = \"seed\"}\nexpect = {fields = {_internal = 2}}", ""},
      {reported + "device = {httpsPostURL = \"https://here/\"}\nexpect = {url = \"https://here/\"}", ""},
      {reported + "device = {RegionCode = \"FR\"}\nexpect = {state = \"enabled\"}",
       "case 1: the state is disabled, not enabled, since the region 'FR' is not among 'US'"},
      {reported + "device = {diagnosticsSubmission = false}\nexpect = {fields = {n = 3}}",
       "no event leaves, the state is disabled, since the user did not agree"},
      {reported + "expect = {url = \"https://other/\"}",
       "the URL is https://collect.example/events, not https://other/"},
      {reported + "expect = {fields = {n = 4}}", "'n' leaves as 3, not 4"},
      {reported + "expect = {fields = {password = \"p\"}}", "'password' does not leave"},
      {reported + "expect = {removed = [\"lens\"]}", "'lens' leaves as \"wide\""},
      {reported + "expect = {removed = [\"pasword\"]}",
       "'pasword' is in neither the payload nor the user info"},
      {reported + "device = {environment = \"development\"}\nexpect = {state = \"enabled\"}",
       "the storebag has no section for the environment development"},
      {"client = {type = 3}\nexpect = {state = \"enabled\"}", "client type 3 has no storebag"},
      {"clinet = \"Camera\"", "case[0].clinet: unknown key; did you mean 'client'?"},
      {"client = 3", "case[0].client: must be a text, is 3"},
      {"client = \"Camera\"", "case[0].expect: missing, the case can't fail"},
      {"expect = {sate = \"enabled\"}", "case[0].expect.sate: unknown key; did you mean 'state'?"},
      {"category = 65536", "case[0].category: must be from 0 to 65535"},
      {"device = {RegionCod = \"DE\"}\nexpect = {state = \"enabled\"}",
       "case[0].device.RegionCod: unknown fact; did you mean 'RegionCode'?"},
      {"device = {RegionCode = \"Germany\"}\nexpect = {state = \"enabled\"}",
       "case[0].device.RegionCode: must be two letters, is \"Germany\""},
      {"device = {environment = \"relase\"}\nexpect = {state = \"enabled\"}",
       "no environment has the name \"relase\"; did you mean 'release'?"},
      {"device = \"none.toml\"\nexpect = {state = \"enabled\"}", "none.toml: No such file"},
  };
  TempDirectory files;
  files.write("z.toml", kStorebag);
  for (const auto& [toml, says] : cases) {
    const std::string file =
        files.write("cases.toml",
                    "storebag = \"z.toml\"\ndevice = {RegionCode = \"US\", environment = "
                    "\"release\"}\n[[case]]\n" +
                        toml);
    const auto outcome = veskreport({"storebag", "test", file});
    EXPECT_EQ(outcome.status, *says == '\0' ? 0 : 1) << toml << "\n" << outcome.output << outcome.errors;
    EXPECT_TRUE(outcome.says(*says == '\0' ? "ok: case 1\n" + file + ": 1 case, 0 failed\n" : says))
        << toml << "\n"
        << outcome.output << outcome.errors;
  }
}

TEST(StorebagTest, NeedsAStorebagAndCases) {
  TempDirectory files;
  const std::string storebag = files.write("z.toml", kStorebag);
  const std::string file = files.write("cases.toml", std::string("[[case]]\nname = \"a\"\n") + kReported +
                                                         "device = {environment = \"release\"}\n"
                                                         "expect = {state = \"enabled\"}");
  EXPECT_TRUE(veskreport({"storebag", "test", file}).says("names no storebag"));
  EXPECT_EQ(veskreport({"storebag", "test", file, "--storebag", storebag, "--json"}).output,
            R"({"status":"done","case":"a","passed":true,"failures":[]})"
            "\n"
            R"({"status":"done","cases":1,"failed":0})"
            "\n");
  EXPECT_TRUE(veskreport({"storebag", "test", files.write("no.toml", "")}).says("there is no [[case]]"));
  EXPECT_EQ(veskreport({"storebag", "test", VESK_SOURCE_DIRECTORY "/examples/zelko-cases.toml"}).status, 0);
}

TEST(Explain, AnswersWithoutADaemonAsTheDaemonDoes) {
  DaemonHarness harness;
  harness.setDeviceFact("DeviceName", "\"Pine\"");
  harness.writeStorebag("zelko", std::string("version = \"3\"\n") + kStorebag);
  harness.startDaemon();
  const RoadClient client(harness);  // has the daemon fetch the storebag
  const std::string storebag = harness.root / "storebags/zelko.toml";
  const std::string facts = harness.root.write(
      "facts.toml", harness.root.read("etc/veskreporting/device.toml") +
                        harness.root.read("etc/veskreporting/preferences/com.corvane.veskreporting.toml"));
  for (const char* name : {"Camera", "Other"}) {
    const std::vector<std::string> question{"explain",       "--json", "--client-type", "5",
                                            "--client-name", name,     "--draw",        "0.7"};
    auto online = question, offline = question;
    online.insert(online.end(), {"--root", harness.root.path().string()});
    offline.insert(offline.end(), {"--storebag", storebag, "--device", facts});
    const auto answer = veskreport(online);
    EXPECT_EQ(answer.status, 0) << answer.errors;
    EXPECT_EQ(boost::json::parse(veskreport(offline).output), boost::json::parse(answer.output));
  }
  EXPECT_TRUE(
      veskreport({"explain", "--client-type", "5", "--storebag", storebag, "--device", "RegionCode=US,x"})
          .says("--device: 'x' is no key=value"));
}

}  // namespace
}  // namespace vesk::test
