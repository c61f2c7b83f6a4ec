// Storebags that are kept on disk, and the signed keys that protect against a wrong one.
#include "tests/support/HandClock.h"
#include "tests/support/StorebagFetchTest.h"

namespace vesk::test {
namespace {

TEST_F(StorebagFetch, SignedKeysProtectAgainstAnotherAnOldAndAnExpiredStorebag) {
  HandClock clock;
  bool isClockSet = true;
  StorebagAcceptance acceptance(clock, [&] { return isClockSet; });
  library.acceptance = &acceptance;
  const auto seconds = [&](double fromNow) { return Date{1'700'000'000 + fromNow}; };
  const struct {
    Dictionary keys;
    const char* refusal;
  } cases[] = {
      {{{"serial", 4}}, nullptr},
      {{{"name", "zelko"}, {"serial", 5}, {"expires", seconds(60)}}, nullptr},
      {{{"name", "zelko"}, {"serial", 5}}, nullptr},
      {{{"name", "palvo"}, {"serial", 9}}, "it is the storebag 'palvo'"},
      {{{"name", 3}, {"serial", 9}}, "its name is no text"},
      {{{"serial", 4}}, "its serial is 4, after 5"},
      {{}, "it has no serial, after 5"},
      {{{"serial", -1}}, "its serial is no integer from 0"},
      {{{"serial", "6"}}, "its serial is no integer from 0"},
      {{{"serial", 6.9}}, "its serial is no integer from 0"},
      {{{"serial", 6}, {"expires", seconds(-1)}}, "it has expired"},
      {{{"serial", 6}, {"expires", "2027-01-01"}}, "its key 'expires' is no date"},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.refusal ? test.refusal : "accepted");
    serve(signedStorebag(payload(test.keys)));
    EXPECT_EQ(fetch().has_value(), test.refusal == nullptr);
    EXPECT_EQ(log.count(3, withName(std::string("Storebag 'zelko' is refused: ") +
                                    (test.refusal ? test.refusal : ""))),
              test.refusal ? 1 : 0);
  }
  EXPECT_FALSE(acceptance.hasExpired("zelko"));
  isClockSet = false;
  serve(signedStorebag(payload({{"serial", 7}, {"expires", seconds(-1)}})));
  EXPECT_TRUE(fetch()) << "nobody knows the time";
  EXPECT_FALSE(acceptance.hasExpired("zelko"));
  isClockSet = true;
  log.clear();
  EXPECT_TRUE(acceptance.hasExpired("zelko"));
  EXPECT_TRUE(acceptance.hasExpired("zelko"));
  EXPECT_EQ(log.countContaining(3, "'zelko' has expired"), 1);

  kept =
      std::make_unique<KeptStorebags>((testRoot() / "kept-serial").string(), library.publicKeys, &acceptance);
  std::filesystem::create_directory(testRoot() / "kept-serial");
  serve(signedStorebag(payload({{"serial", 8}})));
  EXPECT_TRUE(fetch());
  StorebagAcceptance restarted(clock, [] { return true; });
  library.acceptance = &restarted;
  kept =
      std::make_unique<KeptStorebags>((testRoot() / "kept-serial").string(), library.publicKeys, &restarted);
  EXPECT_TRUE(keptStorebagForClientType(*kept, 5));
  serve(signedStorebag(payload({{"serial", 7}})));
  EXPECT_FALSE(fetch()) << "the kept one's serial survives a restart";
  serve(signedStorebag(payload({{"serial", 9}, {"expires", seconds(60)}})));
  EXPECT_TRUE(fetch());
  clock.advance(std::chrono::seconds(61));
  StorebagAcceptance later(clock, [] { return true; });
  library.acceptance = &later;
  kept = std::make_unique<KeptStorebags>((testRoot() / "kept-serial").string(), library.publicKeys, &later);
  EXPECT_FALSE(keptStorebagForClientType(*kept, 5)) << "it has expired";
  serve(signedStorebag(payload({{"serial", 8}})));
  EXPECT_FALSE(fetch()) << "an expired one's serial counts";
}

TEST_F(StorebagFetch, AKeptStorebagServesUntilItIsTamperedWith) {
  const auto directory = testRoot() / "kept";
  kept = std::make_unique<KeptStorebags>(directory.string(), library.publicKeys);
  EXPECT_FALSE(keptStorebagForClientType(*kept, 7));
  serve(signedStorebag(payload()), {{"Last-Modified", "Mon"}});
  EXPECT_EQ(fetch(7), kSeed);
  serve("rubbish", {{"Last-Modified", "Tue"}});
  EXPECT_FALSE(fetch(7)) << "only a good one is kept";
  const auto section = keptStorebagForClientType(*kept, 7);
  ASSERT_TRUE(section);
  EXPECT_EQ(section->section, kSeed);
  EXPECT_EQ(section->version, "2.5");
  EXPECT_EQ(section->lastModified, "Mon");
  EXPECT_FALSE(keptStorebagForClientType(*kept, 5)) << "of another name";
  server().stop();
  EXPECT_FALSE(fetch(7)) << "the built-in storebag does not replace it";
  server().start();

  const auto file = directory / "palvo.storebag";
  std::string bytes = testRoot().read("kept/palvo.storebag");
  const auto bag = bytes.find("<key>bag</key>");
  ASSERT_NE(bag, std::string::npos);
  bytes[bag + 60] = bytes[bag + 60] == 'A' ? 'B' : 'A';
  for (const std::string& bad : {bytes, bytes.substr(0, 300), std::string("Mon"), std::string()}) {
    std::ofstream(file, std::ios::binary) << bad;
    log.clear();
    EXPECT_FALSE(keptStorebagForClientType(*kept, 7));
    EXPECT_EQ(log.countContaining(3, "palvo.storebag is removed"), 1) << bad.size();
    EXPECT_FALSE(std::filesystem::exists(file));
  }
}

}  // namespace
}  // namespace vesk::test
