#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingLogging.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <set>
#include <thread>

#include "common/PersistentIdentifiers.h"
#include "platform/files/FileDescriptor.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

TEST(ClientResources, TheVersionIsTheFirstLineWhenItIsAWord) {
  struct Case {
    std::string file;
    std::optional<std::string> version;
  };
  EXPECT_EQ(VeskReporting::version(), "7.0");
  CapturedLog log;
  for (const Case& c :
       {Case{"7.1.2\n", "7.1.2"}, Case{"  8 \r\n# notes\n", "8"}, Case{"", std::nullopt},
        Case{"7.0 beta\n", std::nullopt}, Case{"7\x01", std::nullopt},
        Case{std::string(65, '1'), std::nullopt}, Case{std::string(5000, ' '), std::nullopt}}) {
    SCOPED_TRACE(c.file);
    testRoot().write("usr/share/veskreporting/version", c.file);
    EXPECT_EQ(VeskReporting::version(), c.version.value_or("7.0"));
  }
}

TEST(ClientResources, ThePublicKeyIsThereOrNot) {
  EXPECT_EQ(VeskReporting::publicKey(), std::nullopt);
  const std::string bytes("\x30\0\x82", 3);
  testRoot().write("usr/share/veskreporting/publicKey.der", bytes);
  EXPECT_EQ(VeskReporting::publicKey(), bytes);
  CapturedLog log;
  for (std::size_t size : {std::size_t{0}, (std::size_t{64} << 10) + 1}) {
    testRoot().write("usr/share/veskreporting/publicKey.der", std::string(size, 'x'));
    EXPECT_EQ(VeskReporting::publicKey(), std::nullopt);
  }
}

TEST(ClientIdentifiers, AreOnePerConsentModeAndLast) {
  TempDirectory directory;
  std::string path = directory / "lib/identifiers.toml";
  PersistentIdentifiers first(path);
  std::string respecting = first.identifier(true), overriding = first.identifier(false);
  EXPECT_EQ(respecting.size(), 36U);
  EXPECT_NE(respecting, overriding);
  PersistentIdentifiers second(path);
  EXPECT_EQ(second.identifier(true), respecting);
  EXPECT_EQ(second.identifier(false), overriding);
  struct stat status {};
  ASSERT_EQ(::stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0600U);
}

TEST(ClientIdentifiers, BelongToTheDirectorysOwnerWhenRootAsksFirst) {
  TempDirectory directory;
  if (::chown(directory.path().c_str(), 65534, 65534) != 0)
    GTEST_SKIP() << "needs the right to give files away";
  PersistentIdentifiers(directory / "identifiers.toml").identifier(true);
  for (const char* name : {"identifiers.toml", "identifiers.toml.lock"}) {
    struct stat status {};
    ASSERT_EQ(::stat((directory / name).c_str(), &status), 0) << name;
    EXPECT_EQ(status.st_uid, 65534U) << name;
  }
}

TEST(ClientIdentifiers, RacingFirstUsesAgree) {
  TempDirectory directory;
  std::string path = directory / "identifiers.toml";
  std::vector<std::string> seen(3);  // each waits half a second for the others at most
  std::vector<std::thread> threads;
  for (auto& identifier : seen) {
    threads.emplace_back([&] { identifier = PersistentIdentifiers(path).identifier(true); });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(std::set<std::string>(seen.begin(), seen.end()).size(), 1U);
}

TEST(ClientIdentifiers, AFileThatCannotBeUnderstoodIsKeptAside) {
  const std::string good = "\"00000000-0000-4000-8000-000000000000\"\n";
  for (const std::string& text :
       {std::string("nonsense"), "respects_consent = " + good,
        "respects_consent = \"x\"\noverrides_consent = " + good, std::string(5000, '#')}) {
    TempDirectory directory;
    CapturedLog log;
    auto path = directory.write("identifiers.toml", text);
    std::string made = PersistentIdentifiers(path).identifier(true);
    EXPECT_EQ(made.size(), 36U);
    EXPECT_EQ(PersistentIdentifiers(path).identifier(true), made);
    EXPECT_EQ(directory.read("identifiers.toml.bad"), text);
    EXPECT_EQ(log.lines().size(), 1U);
  }
}

TEST(ClientIdentifiers, LiveAsLongAsTheProcessWhenTheyCannotBeKept) {
  TempDirectory directory;
  directory.write("lib", "a file where a directory should be");
  FileDescriptor lock(::open(directory.write("identifiers.toml.lock", "").c_str(), O_RDWR | O_CLOEXEC));
  ASSERT_EQ(::flock(lock.get(), LOCK_EX), 0);
  for (const char* path : {"lib/identifiers.toml", "identifiers.toml"}) {
    CapturedLog log;
    PersistentIdentifiers identifiers(directory / path);
    std::string made = identifiers.identifier(true);
    EXPECT_EQ(made.size(), 36U);
    EXPECT_EQ(identifiers.identifier(true), made);
    EXPECT_EQ(log.lines().size(), 1U);
  }
}

TEST(ClientLogging, HandsLinesToTheHost) {
  std::vector<std::pair<int, std::string>> lines;
  VeskReportingLogging::startLogging("host", "Test");
  VeskReportingLogging::setSink([&](int level, std::string_view line) { lines.emplace_back(level, line); });
  VeskReportingLogging::setLevel(4);
  VESK_LOG_WARNING("seen %d", 1);
  VESK_LOG_INFO("not seen");
  VeskReportingLogging::setLevel(6);
  VeskReportingLogging::setSink(nullptr);
  VeskReportingLogging::close();
  EXPECT_EQ(lines, (std::vector<std::pair<int, std::string>>{{4, "seen 1"}}));
}

}  // namespace
}  // namespace vesk::test
