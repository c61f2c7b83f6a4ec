// `veskreport storebag check`: a bad storebag for each finding.
#include <gtest/gtest.h>

#include "tests/support/TempDirectory.h"
#include "tests/support/Veskreport.h"

namespace vesk::test {
namespace {

// A storebag without findings, of which cases replace parts.
constexpr std::string_view kGood = R"(version = "1"
[development]
[corvane_internal]
[[release.httpPost.clients]]
client = "Camera"
locale_whitelist = ["DE"]
sampling_threshold = 0.5
filters = [{key = "user", action = "sha256", method = 3}]
post_url = "https://collect.example/events"
)";

std::string with(std::string_view part, std::string_view replacement) {
  std::string text(kGood);
  const auto at = text.find(part);
  EXPECT_NE(at, std::string::npos) << part;
  return text.replace(at, part.size(), replacement);
}

std::string followedBy(std::string_view more) { return std::string(kGood) + std::string(more); }

constexpr const char* kLimits =
    "locale_whitelist = [\"DE\"]\nsampling_threshold = 1\nfilters = []\n"
    "post_url = \"https://collect.example/\"\n";

struct Case {
  std::string storebag;
  const char* finding;  // the beginning of a line
};

const std::vector<Case>& cases() {
  static const std::vector<Case> all{
      {with("\"Camera\"", "3"), "error: release.httpPost.clients[0].client: must be a text, is 3"},
      {with("https:", "htps:"),
       "error: release.httpPost.clients[0].post_url: 'htps://collect.example/events' is not an http or https "
       "URL"},
      {with("collect.example", "h:70000"),
       "error: release.httpPost.clients[0].post_url: 'https://h:70000/events' has a port that is not"},
      {with("= 3", "= 65536"), "error: release.httpPost.clients[0].filters[0].method: is 65536, no message"},
      {followedBy("[release.dashboard]\nip = \"127.0.0.1\"\nport = \"70000\"\n"),
       "error: release.dashboard.port: is \"70000\", no server has this port"},
      {followedBy("[release.dashboard]\nip = \"localhost\"\nport = 1\n"),
       "error: release.dashboard.ip: not four decimal numbers"},
      {with("version", "verzion"), "warning: verzion: unknown key; did you mean 'version'?"},
      {with("post_url", "post_uri"),
       "warning: release.httpPost.clients[0].post_uri: unknown key; did you mean 'post_url'?"},
      {with("sha256", "sha-256"),
       "warning: release.httpPost.clients[0].filters[0].action: neither \"remove\" nor "
       "\"sha256\", the filter changes nothing; did you mean 'sha256'?"},
      {followedBy("[relase.wren]\n"),
       "warning: relase: no environment has this name; did you mean 'release'?"},
      {followedBy("[release.renw]\n"),
       "warning: release.renw: no backend has this name; did you mean 'wren'?"},
      {with("0.5", "50"), "warning: release.httpPost.clients[0].sampling_threshold: is 50, it is a share"},
      {with("version", "refresh_cycle = 0\nversion"), "warning: refresh_cycle: is 0, every session's start"},
      {with("version", "expires = 2020-01-31\nversion"), "warning: expires: is past, daemons refuse"},
      {with("post_url = \"https://collect.example/events\"", ""),
       "warning: release.httpPost.clients[0].post_url: missing, events are dropped"},
      {with("filters", "override_sampling = 0.25\nfilters"),
       "warning: release.httpPost.clients[0].override_sampling: is 0.25, below the sampling_threshold 0.5"},
      {with("filters = [", "filters = [{key = \"USER\", action = \"remove\"}, "),
       "warning: release.httpPost.clients[0].filters[1]: never applies, filters[0] decides about 'user' "
       "first"},
      {followedBy(std::string("[[release.httpPost.clients]]\nclient = \"CAMERA\"\nservice = \"x\"\n") +
                  kLimits),
       "warning: release.httpPost.clients[1]: is never reached, clients[0] before it is for all of its "
       "sessions"},
      {followedBy(std::string("[[release.httpPost.clients]]\nclient = \"Other\"\nservice = \"\"\n") +
                  kLimits),
       "warning: release.httpPost.clients[1]: is never reached, no session has such names"},
      {with("[development]\n", ""),
       "warning: development: no section, devices in this environment report nothing"},
      {with("[\"DE\"]", "[]"),
       "warning: release: no session that requires user info reports; httpPost: the locale_whitelist is "
       "empty"},
      {with("0.5", "-1\noverride_sampling = -1"),
       "warning: release: no session that requires user info reports; httpPost: the draw"},
      {followedBy("[seed.uploadServer]\n"),
       "warning: seed: no session that requires user info reports; "
       "uploadServer: the backend is not built"},
  };
  return all;
}

TEST(StorebagCheck, FindsEveryMistake) {
  TempDirectory files;
  for (const auto& [storebag, finding] : cases()) {
    const auto outcome = veskreport({"storebag", "check", files.write("z.toml", storebag)});
    EXPECT_NE(("\n" + outcome.output).find("\n" + std::string(finding)), std::string::npos) << finding << "\n"
                                                                                            << outcome.output;
    EXPECT_EQ(outcome.status, std::string_view(finding).starts_with("error") ? 1 : 0) << outcome.output;
  }
}

TEST(StorebagCheck, SaysNothingOfAGoodOne) {
  TempDirectory files;
  const std::string narrowed =
      std::string("[[release.httpPost.clients]]\nclient = \"Camera,Other\"\n") + kLimits +
      "[[release.httpPost.clients]]\n" + kLimits +
      "[release.wren]\n[seed.dashboard]\nip = \"127.0.0.1\"\nport = 9053\nreliable = 500\n";
  for (const auto& storebag : {std::string(kGood), followedBy(narrowed)}) {
    const std::string file = files.write("z.toml", storebag);
    const auto outcome = veskreport({"storebag", "check", "--strict", file});
    EXPECT_EQ(outcome.output, file + ": 0 errors, 0 warnings\n");
    EXPECT_EQ(outcome.status, 0);
  }
}

TEST(StorebagCheck, CountsWarningsAsErrorsAndSpeaksJSON) {
  TempDirectory files;
  const std::string file = files.write("z.toml", with("version", "verzion"));
  EXPECT_EQ(veskreport({"storebag", "check", file}).status, 0);
  const auto outcome = veskreport({"storebag", "check", "--strict", "--json", file});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.errors, "veskreport: " + file + ": 2 errors, 0 warnings\n");
  EXPECT_NE(
      outcome.output.find(R"({"status":"done","severity":"error","place":"verzion","text":"unknown key; )"
                          R"(did you mean 'version'?"})"
                          "\n"),
      std::string::npos)
      << outcome.output;
  EXPECT_NE(outcome.output.find(R"("errors":2,"warnings":0})"), std::string::npos);
}

TEST(StorebagCheck, ShowsWhatChangesForWhom) {
  const Case changes[] = {
      {with("0.5", "0.25"),
       "seed, release: httpPost: Camera: in DE with consent: reports for 25 % of the sessions "
       "instead of 50 % of the sessions"},
      {with("[\"DE\"]", "[\"DE\", \"FR\"]"),
       "seed, release: httpPost: Camera: in FR with consent: starts to report for 50 % of the sessions, to "
       "https://collect.example/events"},
      {with("[\"DE\"]", "[\"FR\"]"),
       "seed, release: httpPost: Camera: in DE with consent: stops reporting, since the region 'DE' is not "
       "among "
       "'FR'"},
      {with("filters", "override_dnu = 1\nfilters"),
       "seed, release: httpPost: Camera: in DE without consent: starts to report for 50 %"},
      {with("filters", "device_whitelist = [\"Pine\"]\nfilters"),
       "seed, release: httpPost: Camera: in DE on other devices with consent: stops reporting"},
      {with("\"Camera\"", "\"camera,Other\""),
       "seed, release: httpPost: Other: in DE with consent: starts to report"},
      {with("filters", "expedite = 0\nfilters"),
       "seed, release: httpPost: Camera: in DE with consent: collects batches"},
      {with("0.5", "-1"), "seed, release: httpPost: Camera: in DE with consent: holds messages back now"},
      {with("collect.example", "other.example"),
       "seed, release: httpPost: sessions that do not require user info: every device: posts to "
       "https://other.example/events instead of https://collect.example/events"},
      {with("{key = \"user\", action = \"sha256\", method = 3}", ""),
       "seed, release: httpPost: Camera: in DE with consent: 'user' leaves in the clear now in messages of "
       "category 3"},
      {with("method = 3", "status = 2"),
       "seed, release: httpPost: Camera: in DE with consent: 'user' leaves only as a digest now in messages "
       "of type 2"},
      {with("sha256", "remove"),
       "seed, release: httpPost: Camera: in DE with consent: 'user' no longer leaves as a digest"},
      {with("[{", "[{key = \"path\", action = \"remove\"}, {"),
       "seed, release: httpPost: Camera: in DE with consent: 'path' no longer leaves\n"},
      {followedBy("[seed.wren]\n"),
       "seed: httpPost: Camera: in DE with consent: stops reporting, since the backend is gone"},
      {followedBy("[seed.wren]\n"), "seed: wren: starts to report"},
      {followedBy("[release.uploadServer]\npost_url = \"https://u/\"\n"),
       "seed, release: uploadServer: starts to report"},
      {std::string(kGood), ": 0 errors, 0 warnings, 0 changes"},
  };
  TempDirectory files;
  const std::string old = files.write("old.toml", kGood);
  for (const auto& [storebag, change] : changes) {
    const auto outcome = veskreport({"storebag", "check", files.write("z.toml", storebag), "--against", old});
    const bool isSummary = *change == ':';
    EXPECT_TRUE(outcome.says((isSummary ? "z.toml" : "change: ") + std::string(change))) << change << "\n"
                                                                                         << outcome.output;
    EXPECT_EQ(outcome.status, 0);
  }
  const std::string changed = files.write("z.toml", with("[\"DE\"]", "[\"FR\"]"));
  const auto outcome =
      veskreport({"storebag", "check", changed, "--against", old, "--device",
                  "RegionCode=FR,environment=release", "--device", "RegionCode=IT", "--json"});
  EXPECT_EQ(
      outcome.output,
      R"({"status":"done","environment":"release","backend":"httpPost","clients":"Camera",)"
      R"("devices":"RegionCode=FR,environment=release","change":"starts to report for 50 % of the sessions, )"
      R"(to https://collect.example/events"})"
      "\n"
      R"({"status":"done","errors":0,"warnings":0,"changes":1})"
      "\n");
  EXPECT_EQ(veskreport({"storebag", "check", changed, "--device", "RegionCode=FR"}).status, 2);
}

}  // namespace
}  // namespace vesk::test
