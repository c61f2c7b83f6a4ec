// The client library when memory runs out: nothing ends but what had no room, and that is told once.
#include "tests/support/ClientHarness.h"
#include "tests/support/ScarceMemory.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

using ClientMemory = ClientHarness;

TEST_F(ClientMemory, RunningOutOnTheCallersThreadRefusesTheCall) {
  auto file = directory.write("file", "contents");
  const auto missing = directory / "a name that is too long to be kept in place";
  const Dictionary info = sessionInfo;
  const std::vector<std::string> none;
  daemon.emplace(socket, record);
  using Operation = std::function<ReportingStatus(VeskReporting&)>;
  const std::pair<const char*, Operation> operations[] = {
      {"connect", [](auto& session) { return session.connect().status; }},
      {"configure", [&](auto& session) { return session.setSessionInfo(info, info, none, [](auto&) {}); }},
      {"start", [](auto& session) { return session.startConfig([](auto) {}); }},
      {"send", [&](auto& session) { return session.sendMessage(1, 1, info); }},
      {"flush", [](auto& session) { return session.flushMessagesAndWait().status; }},
      {"upload", [&](auto& session) { return session.uploadFile(file).status; }},
      {"upload nothing", [&](auto& session) { return session.uploadFile(missing).status; }},
      {"upload without waiting", [&](auto& session) { return session.uploadFile(missing, nullptr); }}};
  for (bool isLasting : {false, true}) {
    VeskReporting session(options());
    for (const auto& [what, operation] : operations) {
      for (long n = 1; n == 1 || ScarceMemory::hasRunOut(); ++n) {
        SCOPED_TRACE(std::string(what) + ", allocation " + std::to_string(n));
        ReportingStatus status;
        try {
          ScarceMemory scarce(n, isLasting);
          status = operation(session);
        } catch (const std::bad_alloc&) {
          status = ReportingStatus::OutOfResources;  // of the arguments, which are the caller's own
        }
        EXPECT_EQ(status == ReportingStatus::OutOfResources, ScarceMemory::hasRunOut()) << describe(status);
        EXPECT_TRUE(session.connect());
      }
    }
  }
}

TEST_F(ClientMemory, RunningOutOnTheSessionsThreadLosesNoCallAndEndsEachOnce) {
  constexpr std::size_t kAsked = 4;
  auto file = directory.write("file", "contents");
  const Dictionary info{{"clientType", 3}, {"name", "one that is too long to be kept in place"}};
  for (long n = 1; n == 1 || ScarceMemory::hasRunOut(); ++n) {
    SCOPED_TRACE("allocation " + std::to_string(n));
    Record own;
    std::vector<std::size_t> ends(kAsked);
    auto ended = [&](std::size_t i) { return [&ends, i](const auto&) { ++ends[i]; }; };
    std::optional<RecordingDaemon> there(std::in_place, socket, own);
    {
      ScarceMemory scarce(n, false, "vesk-reporting");
      VeskReporting session(options());
      std::ignore = session.setSessionInfo(info, info, {}, [](auto&) {});
      std::ignore = session.startConfig(ended(0));
      for (std::uint16_t i = 0; i < 5; ++i) std::ignore = session.sendMessage(i, 0, info);
      std::ignore = session.uploadFile(file, ended(1));
      std::ignore = session.sendMessage(5, 0, info, ended(2));
      ASSERT_TRUE(own.waitFor("message 5")) << testing::PrintToString(own.lines());
      there.reset();
      std::ignore = session.sendMessage(6, 0, info);
      std::ignore = session.fetchDisplayURL(ended(3));
      there.emplace(socket, own);
    }
    EXPECT_EQ(ends, std::vector<std::size_t>(kAsked, 1));
    std::string received;
    for (const auto& line : own.lines())
      received += line.substr(0, line.starts_with("message") ? 9 : 3) + " ";
    EXPECT_EQ(received,
              "set sta message 0 message 1 message 2 message 3 message 4 upl message 5 "
              "set sta message 6 fet ");
  }
}

}  // namespace
}  // namespace vesk::test
