// Fetching storebags over real TLS, with real keys and signatures.
#include "tests/support/StorebagFetchTest.h"

namespace vesk::test {
namespace {

TEST_F(StorebagFetch, ReturnsTheSectionOfTheEnvironment) {
  serve(signedStorebag(payload()), {{"Cache-Control", "public"}, {"cache-control", "max-age=600"}});
  EXPECT_EQ(fetch(), kSeed);
  EXPECT_EQ(version, "2.5");
  EXPECT_EQ(maxAge, 600);
  EXPECT_FALSE(notModified);
  EXPECT_FALSE(lastModified);
  EXPECT_EQ(log.lines(), (Lines{{7, withName("Storebag Server URL: " + url("zelko"))}}));
  auto request = server().requests().back();
  EXPECT_EQ(request.method, "GET");
  EXPECT_EQ(request.target, "/bags/sorrel/zelko?version=7.3");
  EXPECT_FALSE(request.header("If-Modified-Since"));
}

TEST_F(StorebagFetch, TakesEveryEncodingOfPropertyListsWithWhateverStatus) {
  auto xml = serialized(payload());
  auto binary = *writeBinaryPropertyList(payload());
  auto broken = document(xml, xml);
  auto withBreaks = base64Encode(xml);
  for (std::size_t at = 60; at < withBreaks.size(); at += 62) withBreaks.insert(at, "\n\t");
  MutableDictionary changed(broken);
  changed.set("bag", withBreaks);
  changed.set("other", List{1, 2});
  for (const auto& body : {serialized(document(binary, binary)), *writeBinaryPropertyList(document(xml, xml)),
                           *writeBinaryPropertyList(document(binary, binary)), serialized(changed.share())}) {
    for (unsigned status : {200u, 404u, 500u}) {
      serve(body, {}, status);
      EXPECT_EQ(fetch(), kSeed);
      EXPECT_EQ(maxAge, 86400);
    }
  }
}

TEST_F(StorebagFetch, EveryFailureSaysWhatItIs) {
  const auto xml = serialized(payload());
  const auto good = document(xml, xml);
  auto changed = [&](std::string_view key, std::optional<Value> value) {
    MutableDictionary copy(good);
    copy.remove(key);
    if (value) copy.set(key, *value);
    return serialized(copy.share());
  };
  const std::pair<int, std::string> unfetched{3, forClientType("Could not fetch storebag for client type 5")};
  const std::pair<int, std::string> unsigned_{3, withName("Signature is missing")};
  const std::pair<int, std::string> invalid{3, withName("Signature can not be verified, 0x")};
  const std::pair<int, std::string> unreadable{
      3, withName("propertyListWithData error " + parsePropertyList("junk").error().text)};
  const std::tuple<const char*, std::string, Lines> cases[] = {
      {"no property list", "junk", {unreadable, unsigned_, unfetched}},
      {"no content",
       "",
       {{3, withName("propertyListWithData error " + parsePropertyList("").error().text)},
        unsigned_,
        unfetched}},
      {"a list", *writeXMLPropertyList(List{1}), {unsigned_, unfetched}},
      {"no signature", changed("signature", std::nullopt), {unsigned_, unfetched}},
      {"a number as signature", changed("signature", 1), {unsigned_, unfetched}},
      {"a signature that is no base64", changed("signature", "abc"), {unfetched}},
      {"no bag", changed("bag", std::nullopt), {unfetched}},
      {"a bag that is no base64", changed("bag", "abcde"), {unfetched}},
      {"a signature over other bytes", serialized(document(xml, xml + " ")), {invalid, unfetched}},
      {"a signature by another key",
       changed("signature", base64Encode(TestSigningKey().sign(xml))),
       {invalid, unfetched}},
      {"an empty signature", changed("signature", ""), {invalid, unfetched}},
      {"a payload that is no property list", serialized(document("junk", "junk")), {unfetched}},
      {"a payload that is a list",
       serialized(document(*writeXMLPropertyList(List{}), *writeXMLPropertyList(List{}))),
       {unfetched}}};
  for (const auto& [name, body, expectedLines] : cases) {
    SCOPED_TRACE(name);
    serve(body, {{"Cache-Control", "max-age=77"}});
    EXPECT_FALSE(fetch());
    EXPECT_FALSE(version);
    EXPECT_FALSE(notModified);
    EXPECT_EQ(maxAge, 77) << "written before anything fails";
    EXPECT_EQ(lines(), expectedLines);
  }
}

TEST_F(StorebagFetch, WithoutAUsableKeyNothingIsTrusted) {
  serve(signedStorebag(payload()));
  for (const auto& keys : {PublicKeys(), PublicKeys{"rubbish"}}) {
    library.publicKeys = [keys] { return keys; };
    EXPECT_FALSE(fetch());
    EXPECT_EQ(lines(), (Lines{{3, forClientType("Could not fetch storebag for client type 5")}}));
  }
}

TEST_F(StorebagFetch, AnyOfTheKeysVerifies) {
  serve(signedStorebag(payload()));
  library.publicKeys = [] { return PublicKeys{"rubbish", TestSigningKey().publicKeyInfo(), ownKey()}; };
  EXPECT_EQ(fetch(), kSeed);
  library.publicKeys = [] {
    return PublicKeys{TestSigningKey().publicKeyInfo(), TestSigningKey().publicKeyInfo()};
  };
  EXPECT_FALSE(fetch());
  EXPECT_EQ(log.countContaining(3, "Signature can not be verified"), 1) << "one line, after all keys";
}

TEST_F(StorebagFetch, AClientTypeWithoutStorebagFetchesNothing) {
  auto before = server().count();
  EXPECT_FALSE(fetch(4));
  EXPECT_EQ(lines(), (Lines{{3, forClientType("Could not find storebag name for client type 4")}}));
  EXPECT_EQ(server().count(), before);
  EXPECT_EQ(maxAge, -1);
}

TEST_F(StorebagFetch, AnUnreachableServerMeansTheBuiltInStorebagForOneNameOnly) {
  server().answerWith(faulty(HTTPAnswer::Fault::CloseWithoutAnswer));
  lastModified = "Mon";
  EXPECT_FALSE(fetch(5));
  const std::pair<int, std::string> unfetched{3, forClientType("Could not fetch storebag for client type 5")};
  const auto adding = std::pair(7, withName("Adding 'Last-Modified: Mon' to the header"));
  const auto unresolved = [&](const char* name) {
    return std::pair(6, withName("Error resolving with lookup server " + url(name) +
                                 ", sendSynchronousRequest error " + errorOf(name)));
  };
  EXPECT_EQ(lines(), (Lines{adding, unresolved("zelko"), unfetched}));
  EXPECT_EQ(maxAge, -1);

  for (std::int32_t clientType : {7, 11}) {
    EXPECT_EQ(fetch(clientType), fallbackStorebag().dictionary("release"));
    EXPECT_EQ(version, "1.0.0-Palvo-Fallback");
    EXPECT_EQ(maxAge, 3600);
    EXPECT_FALSE(notModified);
    EXPECT_EQ(lastModified, "Mon");
    EXPECT_EQ(lines(), (Lines{adding,
                              unresolved("palvo"),
                              {6, withName("Loading default storebag 'palvo'")},
                              {4, forClientType("Seed section is missing in the storebag.")},
                              {6, forClientType("Store bag override MaxAge=3600")}}));
  }
  server().stop();
  EXPECT_EQ(fetch(7), fallbackStorebag().dictionary("release"));
  EXPECT_FALSE(fetch(8));
  server().start();
  // An answer of any kind does not count as unreachable.
  serve(std::string(std::size_t{5} << 20, ' '));
  EXPECT_FALSE(fetch(7));
  EXPECT_EQ(lines(), (Lines{adding,
                            {3, withName("propertyListWithData error " + errorOf("palvo"))},
                            {3, withName("Signature is missing")},
                            {3, forClientType("Could not fetch storebag for client type 7")}}));
  serve("", {}, 503);
  EXPECT_FALSE(fetch(11));
  http.stopAllButPosts();
  EXPECT_FALSE(fetch(7)) << "the daemon ends, and the server is as good as ever";
}

TEST_F(StorebagFetch, AsksOnlyForWhatIsNewer) {
  const std::string first = "Tue, 24 Nov 2026 20:00:00 GMT";
  const std::string second = "Wed, 25 Nov 2026 20:00:00 GMT";
  const std::string adding = withName("Adding 'Last-Modified: " + first + "' to the header");
  const std::string unchanged = withName("storebag content has not changed. using its cached version");

  const std::string changed = withName("New 'Last-Modified: " + second + "' received");
  const Lines junk{{7, withName("Adding 'Last-Modified: " + second + "' to the header")},
                   {7, withName("New 'Last-Modified: " + first + "' received")},
                   {3, withName("propertyListWithData error " + parsePropertyList("junk").error().text)},
                   {3, withName("Signature is missing")},
                   {3, forClientType("Could not fetch storebag for client type 5")}};
  const std::pair<int, std::string> empty{
      3, withName("propertyListWithData error " + parsePropertyList("").error().text)};
  const auto good = signedStorebag(payload());
  // wasNotModified, known, age: the outputs of the fetch; an answer without content also sets the age.
  const std::tuple<unsigned, std::string, HTTPHeaderList, bool, std::string, std::int32_t, Lines> cases[] = {
      {200, "", {{"Last-Modified", first}}, false, first, 86400, {junk[1], empty, junk[3], junk[4]}},
      {304,
       "",
       {{"Last-Modified", second}, {"Cache-Control", "max-age=60"}},
       true,
       first,
       60,
       {{7, adding}, {7, unchanged}}},
      // Without the header, an empty answer is a failure.
      {304, "", {}, false, first, 86400, {{7, adding}, empty, junk[3], junk[4]}},
      {200, good, {{"last-modified", second}}, false, second, 86400, {{7, adding}, {7, changed}}},
      // An answer with content is not "not modified", whatever its date.
      {200, "junk", {{"Last-Modified", first}}, false, first, 86400, junk}};
  for (const auto& [status, body, headers, wasNotModified, known, age, expectedLines] : cases) {
    SCOPED_TRACE(known + body);
    const auto before = lastModified;
    serve(body, headers, status);
    EXPECT_EQ(fetch(), body == good ? std::optional(kSeed) : std::nullopt);
    EXPECT_EQ(server().requests().back().header("If-Modified-Since"), before);
    EXPECT_EQ(notModified, wasNotModified);
    EXPECT_EQ(lastModified, known);
    EXPECT_EQ(maxAge, age);
    EXPECT_EQ(lines(), expectedLines);
  }

  // Without `lastModified`, no request is conditional.
  serve(signedStorebag(payload()), {{"Last-Modified", first}});
  EXPECT_TRUE(fetchStorebagWithName(http, library, "zelko", maxAge, notModified, nullptr));
  EXPECT_FALSE(server().requests().back().header("If-Modified-Since"));
}

TEST_F(StorebagFetch, TheStorebagsOwnAgeGoesBeforeTheServers) {
  const std::pair<Value, std::int32_t> cases[] = {{172800, 86400},
                                                  {86401, 86400},
                                                  {300, 300},
                                                  {0, 0},
                                                  {-5, -5},
                                                  {12.9, 12},
                                                  {std::int64_t{1} << 40, 86400},
                                                  {-(std::int64_t{1} << 40), INT32_MIN}};
  for (const auto& [cycle, age] : cases) {
    serve(signedStorebag(payload({{"refresh_cycle", cycle}})), {{"Cache-Control", "max-age=600"}});
    EXPECT_TRUE(fetch());
    EXPECT_EQ(maxAge, age);
    EXPECT_EQ(lines(), (Lines{{6, forClientType("Store bag override MaxAge=" + std::to_string(age))}}));
  }
  serve(signedStorebag(payload({{"refresh_cycle", "300"}, {"version", 3}})),
        {{"Cache-Control", "max-age=600"}});
  EXPECT_TRUE(fetch());
  EXPECT_EQ(maxAge, 600);
  EXPECT_FALSE(version);
  const std::string ofType = " has the wrong type and counts as absent: ";
  EXPECT_EQ(lines(),
            (Lines{{4, "storebag: The storebag's value for 'version'" + ofType + "3"},
                   {4, "storebag: The storebag's value for 'refresh_cycle'" + ofType + describe("300")}}));
}

TEST_F(StorebagFetch, ASeedDeviceTakesTheReleaseSectionWhenThereIsNoOther) {
  const std::pair<int, std::string> missing{4, forClientType("Seed section is missing in the storebag.")};
  const auto none = forClientType("Could not find storebag for client type 5 with release environment");
  serve(signedStorebag(payload({}, "seed")));
  EXPECT_EQ(fetch(), kRelease);
  EXPECT_EQ(lines(), Lines{missing});
  serve(signedStorebag({{"version", "1"}, {"refresh_cycle", 5}}), {{"Cache-Control", "max-age=600"}});
  EXPECT_FALSE(fetch());
  EXPECT_EQ(lines(), (Lines{missing, {3, none}}));
  EXPECT_FALSE(version);
  EXPECT_EQ(maxAge, 600);
}

TEST(StorebagSection, BelongsToItsEnvironment) {
  const char* names[] = {"(none)", "development", "corvane_internal", "seed", "release", "(none)"};
  MutableDictionary whole;
  for (const char* name : names) whole.set(name, Dictionary{{"from", name}});
  const Dictionary all = whole.share();
  CapturedLog log;
  for (std::int32_t type = 0; type < 6; ++type) {
    const bool isNamed = type >= 1 && type <= 4;
    EXPECT_EQ(storebagSectionForEnvironment(all, type, 5),
              isNamed ? std::optional(Dictionary{{"from", names[type]}}) : std::nullopt);
    log.clear();
    EXPECT_FALSE(storebagSectionForEnvironment({}, type, 9));
    Lines lines;
    if (type == 3) lines.emplace_back(4, forClientType("Seed section is missing in the storebag."));
    lines.emplace_back(3, forClientType("Could not find storebag for client type 9 with ") +
                              (type == 3 ? "release" : names[type]) + " environment");
    EXPECT_EQ(log.lines(), lines);
  }
  EXPECT_FALSE(storebagSectionForEnvironment(all, -1, 5));
  EXPECT_FALSE(storebagSectionForEnvironment({{"development", "text"}}, 1, 9));
  EXPECT_EQ(
      log.count(4,
                "storebag: The storebag's value for 'development' has the wrong type and counts as absent: " +
                    describe("text")),
      1);
}

TEST(StorebagRequest, IsGivenUpAfterFifteenSeconds) {
  CapturedLog log;
  auto plain = storebagRequest("http://a/b", std::nullopt);
  EXPECT_EQ(plain.timeout, std::chrono::seconds(15));
  EXPECT_EQ(plain.retry, HTTPRequest::Retry::Never);
  EXPECT_EQ(plain.headers, decltype(plain.headers)());
  EXPECT_EQ(log.lines(), Lines());
}

TEST(StorebagAge, IsWhatCacheControlGrants) {
  const std::pair<std::optional<std::string_view>, std::int32_t> cases[] = {
      {std::nullopt, 86400},
      {"", 86400},
      {"no-cache", 86400},
      {"max-age=600", 600},
      {"public, max-age=600", 600},
      {"max-age", 86400},
      {"max-age=", 0},
      {"max-age=-5", -5},
      {"max-age= 600", 0},
      {"Max-Age=600", 86400},
      {"max-age=1 max-age=2", 1},
      {"public,max-age=600", 86400},
      {"max-age 30", 30},
      {"max-age=99999999999", 2147483647},
      {"max-age=-99999999999", -2147483647 - 1}};
  for (const auto& [header, age] : cases)
    EXPECT_EQ(maxAgeFromCacheControl(header), age) << header.value_or("(none)");
}

}  // namespace
}  // namespace vesk::test
