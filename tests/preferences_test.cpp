#include "platform/preferences/PreferencesSuite.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>

#include "platform/preferences/TomlFile.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"
#include "values/Conversions.h"

namespace vesk::test {
namespace {

constexpr char kSystemFile[] = "etc/veskreporting/preferences/com.example.suite.toml";
constexpr char kUserFile[] = "conf/veskreporting/preferences/com.example.suite.toml";

class Preferences : public testing::Test {
 protected:
  void SetUp() override {
    for (const char* directory : {"etc", "conf", "home"}) std::filesystem::remove_all(testRoot() / directory);
    ::setenv("XDG_CONFIG_HOME", "/conf", 1);
    ::setenv("HOME", "/home/user", 1);
  }
  static std::optional<Value> valueForKey(std::string_view key) {
    return PreferencesSuite("com.example.suite").valueForKey(key);
  }
};

TEST_F(Preferences, HaveEveryKindOfValue) {
  const std::tuple<const char*, const char*, Value> cases[] = {
      {"text", R"("é .......... \" ..........")", "é .......... \" .........."},
      {"lines", R"("""..........\" .......... """")", "..........\" .......... \""},
      {"literal", "'..........'", ".........."},
      {"integer", "-7", -7},
      {"real", "2.5", 2.5},
      {"boolean", "true", true},
      {"date", "2026-11-24", Date{1795478400}},
      {"date with time", "2026-11-24T20:31:29.5+01:00", Date{1795548689.5}},
      {"local date", "2026-11-24T20:31:29", Date{1795552289}},
      {"time", "07:32:00", "07:32:00"},
      {"list", "[1, \"two\"]", List{1, "two"}},
      {"table", "{key = \"value\"}", Dictionary{{"key", "value"}}}};
  std::string file = "# Dots do not make a deep key where there is none. \"..........\n";
  for (const auto& [key, text, value] : cases) file += '"' + std::string(key) + "\" = " + text + '\n';
  testRoot().write(kSystemFile, file);
  for (const auto& [key, text, value] : cases) EXPECT_EQ(valueForKey(key), value) << key;
  EXPECT_EQ(valueForKey("key"), std::nullopt);
}

TEST_F(Preferences, OfTheUserWinKeyByKey) {
  testRoot().write(kSystemFile, "a = 1\nb = 2\n");
  testRoot().write(kUserFile, "b = 3\n");
  EXPECT_EQ(valueForKey("a"), Value(1));
  EXPECT_EQ(valueForKey("b"), Value(3));
}

TEST_F(Preferences, ThatAreUnusableCountAsEmptyWithOneLine) {
  const auto path = testRoot() / kUserFile;
  testRoot().write(kSystemFile, "a = 1\n");
  std::string dots = "a";
  for (int i = 0; i < 300'000; ++i) dots += ".a";
  const std::string contents[] = {"a = ", dots + " = 1", "a = { a.b.c.d.e.f.g.h = 1 }",
                                  "a = " + std::string(100'000, '['),
                                  "a = \"" + std::string(1 << 20, 'x') + "\""};
  for (const auto& content : contents) {
    CapturedLog log;
    testRoot().write(kUserFile, content);
    EXPECT_EQ(valueForKey("a"), Value(1)) << content.substr(0, 50);
    EXPECT_EQ(log.lines().size(), 1u) << content.substr(0, 50);
    EXPECT_EQ(log.countContaining(4, path.string() + " is ignored: "), 1);
  }
  const auto makers = {+[](const char* name) { return ::mkdir(name, 0755); },
                       +[](const char* name) { return ::mkfifo(name, 0644); }};
  for (auto make : makers) {
    std::filesystem::remove(path);
    ASSERT_EQ(make(path.c_str()), 0);
    CapturedLog log;
    EXPECT_EQ(valueForKey("a"), Value(1));
    EXPECT_EQ(log.count(4, path.string() + " is ignored: not a regular file"), 1);
  }
}

TEST_F(Preferences, OfAServicesUserAreTheSystemsOnly) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs another user";
  std::filesystem::permissions(testRoot().path(), std::filesystem::perms{0755});
  testRoot().write(kSystemFile, "a = 1\n");
  testRoot().write(kUserFile, "a = 2\n");
  for (uid_t user : {1u, 54321u, 0u}) {  // without a shell, without an account
    ASSERT_EQ(::seteuid(user), 0);
    EXPECT_EQ(valueForKey("a"), Value(user == 0 ? 2 : 1)) << user;
    ASSERT_EQ(::seteuid(0), 0);
  }
}

TEST_F(Preferences, ThatOthersCanWriteToAreRefusedInOneLine) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs another user";
  constexpr uid_t kService = 1;
  const auto prefix = rootPrefix();
  const auto file = testRoot().write(kSystemFile, "a = 1\n");
  const struct {
    uid_t owner;
    mode_t mode;
    bool hasPrefix;
    TrustedOwner trusted;
    std::string reason;
  } cases[] = {{0, 0644, false, TrustedOwner::Root, ""},
               {0, 0644, true, TrustedOwner::OwnUser, ""},
               {0, 0664, true, TrustedOwner::Root, "others than its owner can write to it (mode 0664)"},
               {0, 0646, true, TrustedOwner::OwnUser, "others than its owner can write to it (mode 0646)"},
               {kService, 0600, true, TrustedOwner::Root, ""},
               {kService, 0600, false, TrustedOwner::OwnUser, ""},
               {kService, 0600, false, TrustedOwner::Root, "it belongs to user 1"},
               {2, 0644, true, TrustedOwner::OwnUser, "it belongs to user 2"}};
  for (const auto& test : cases) {
    SCOPED_TRACE(testing::PrintToString(test.owner) + " " + test.reason);
    ASSERT_EQ(::chown(file.c_str(), test.owner, 0), 0);
    ASSERT_EQ(::chmod(file.c_str(), test.mode), 0);
    CapturedLog log;
    if (!test.hasPrefix) setRootPrefix("");
    ASSERT_EQ(::seteuid(kService), 0);
    for (int i = 0; i < 2; ++i)
      EXPECT_EQ(readTomlFile(file.string(), test.trusted).find("a") != nullptr, test.reason.empty());
    ASSERT_EQ(::seteuid(0), 0);
    setRootPrefix(prefix);
    EXPECT_EQ(log.lines().size(), test.reason.empty() ? 0u : 1u);
    EXPECT_EQ(log.count(4, file.string() + " is refused: " + test.reason), test.reason.empty() ? 0 : 1);
  }
}

}  // namespace
}  // namespace vesk::test
