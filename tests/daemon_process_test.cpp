// The daemon as a process: command line, start, stop, and the storebags that it fetches.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/resource.h>
#include <sys/socket.h>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/UnixSocket.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/SignedStorebag.h"

namespace vesk::test {
namespace {

constexpr char kDaemon[] = VESK_BIN_DIRECTORY "/veskreportingd";
const std::string kVersion = VESK_VERSION;
constexpr char kProfile[] = "usr/share/veskreporting/sandbox/com.corvane.veskreportingd.toml";

/// The log's lines without the text before their level.
std::string withoutTime(const std::string& log) {
  std::string lines;
  for (std::size_t at = 0, end; at < log.size() && (end = log.find('\n', at)) != log.npos; at = end + 1) {
    const std::string line = log.substr(at, end - at);
    lines += line.substr(std::min(line.size(), line.find('<'))) + "\n";
  }
  return lines;
}

TEST(DaemonCommandLine, IsUnderstoodOrSaysWhyNot) {
  const TempDirectory root;
  const std::string nowhere = root.path().string();
  const std::string help =
      "Usage: veskreportingd [--root DIR] [--log-level N] [--idle-exit SECONDS] [--no-sandbox]\n";
  const std::string tryHelp = "Try: veskreportingd --help\n";
  const auto isNot = [](const std::string& option, const std::string& value, const std::string& wanted) {
    return "veskreportingd: " + option + ": \"" + value + "\" is not " + wanted + "\n";
  };
  // With valid options, the daemon gets as far as its sandbox, whose profile is missing.
  const std::string unconfined =
      "<3> main: confine_enter() fails: " + nowhere + "/" + kProfile + ": no such file\n";
  std::vector<std::tuple<std::vector<std::string>, int, std::string, std::string>> cases = {
      {{"--help"}, 0, help, ""},
      {{"--version", "--bogus"}, 0, "veskreportingd " + kVersion + "\n", ""},
      {{"--bogus"}, 2, "", kDaemon + std::string(": unrecognized option '--bogus'\n") + tryHelp},
      {{"--root"}, 2, "", kDaemon + std::string(": option '--root' requires an argument\n") + tryHelp},
      {{"--no-sandbox", "now"}, 2, "", "veskreportingd: unexpected argument \"now\"\n" + tryHelp},
      {{"--root", "here"}, 2, "", isNot("--root", "here", "an absolute path")},
      {{"--root", nowhere}, 255, "", unconfined},
      {{"--root", nowhere + "/", "--log-level", "3"}, 255, "", unconfined},
      {{"--log-level=7", "--root", nowhere, "--idle-exit", "1"}, 255, "", unconfined},
      {{"--root", nowhere, "--idle-exit", "86400"}, 255, "", unconfined}};
  for (const char* level : {"2", "5", "8", "6x", ""})
    cases.push_back({{"--log-level", level}, 2, "", isNot("--log-level", level, "3, 4, 6 or 7")});
  for (const char* time : {"0", "86401"})
    cases.push_back(
        {{"--idle-exit", time}, 2, "", isNot("--idle-exit", time, "a number of seconds from 1 to 86400")});
  for (const auto& [arguments, status, output, errors] : cases) {
    std::vector<std::string> command{kDaemon};
    command.insert(command.end(), arguments.begin(), arguments.end());
    SCOPED_TRACE(command.at(1));
    ChildProcess daemon(command);
    EXPECT_EQ(daemon.wait(), status);
    EXPECT_EQ(daemon.output().substr(0, output.size()), output);
    EXPECT_EQ(daemon.output().empty(), output.empty());
    EXPECT_EQ(status == 255 ? withoutTime(daemon.errors()) : daemon.errors(), errors);
  }
  EXPECT_TRUE(std::filesystem::is_empty(root.path())) << "nothing has been started";
}

/// A daemon whose storebags come from the test's server, which also receives its posts.
class DaemonProcess : public testing::Test {
 protected:
  DaemonProcess() {
    harness.root.write("usr/share/veskreporting/publicKey.der", key.publicKeyInfo());
    harness.root.write("usr/share/veskreporting/version", "7.4\n");
    harness.setPreference("veskreporting_storebag_url", "'" + server.url("/bags") + "'");
  }
  void serve(HTTPAnswer storebag) {
    server.answerWith([storebag](const HTTPReceived& request, std::size_t) {
      return request.method == "GET" ? storebag : HTTPAnswer::text(200, "ok");
    });
  }
  /// A section whose backend posts to that path.
  Dictionary section(const std::string& path) const {
    return {{"httpPost", Dictionary{{"clients", List{Dictionary{{"post_url", server.url(path)}}}}}}};
  }
  std::vector<HTTPReceived> requests(const std::string& method) const {
    std::vector<HTTPReceived> all;
    for (auto& each : server.requests())
      if (each.method == method) all.push_back(each);
    return all;
  }

  DaemonHarness harness;
  TestSigningKey key;
  RecordingServer server;
};

TEST_F(DaemonProcess, FetchesForTheEnvironmentOfItsDevice) {
  MutableDictionary payload(Dictionary{{"version", "1"}});
  for (const char* name : {"development", "corvane_internal", "seed", "release"})
    payload.set(name, section(std::string("/") + name));
  HTTPAnswer storebag;
  storebag.body = signedStorebag(key, payload.share());
  serve(storebag);
  const std::pair<const char*, const char*> cases[] = {
      {"", "/seed"}, {"0", ""}, {"1", "/development"}, {"4", "/release"}, {"-1", "/corvane_internal"}};
  for (const auto& [setting, path] : cases) {
    SCOPED_TRACE(setting);
    harness.setPreference("environmentType", setting);
    harness.startDaemon();
    EXPECT_EQ(RoadClient(harness).enabled.has_value(), *path != '\0');
    EXPECT_EQ(harness.stopDaemon(), 0);
    EXPECT_EQ(*path ? requests("POST").back().path() : "", path);
  }
}

TEST_F(DaemonProcess, AsksOnlyForWhatIsNewer) {
  const std::string time = "Tue,  24 Nov 2026 20:00:00 GMT+1";  // sent back unchanged
  HTTPAnswer storebag;
  storebag.headers = {{"Last-Modified", time}, {"Cache-Control", "public, max-age=600"}};
  storebag.body = signedStorebag(key, Dictionary{{"refresh_cycle", 0}, {"release", section("/post")}});
  serve(storebag);
  harness.startDaemon();
  EXPECT_EQ(RoadClient(harness).enabled, BackendNames{"httpPost"});
  HTTPAnswer unchanged;
  unchanged.status = 304;
  unchanged.headers = {{"Last-Modified", "Wed, 25 Nov 2026 20:00:00 GMT"}, {"Cache-Control", "max-age=600"}};
  serve(unchanged);
  for (int i = 0; i < 2; ++i) EXPECT_EQ(RoadClient(harness).enabled, BackendNames{"httpPost"});
  auto fetches = requests("GET");
  ASSERT_EQ(fetches.size(), 2u) << "then it is fresh for 600 s";
  EXPECT_FALSE(fetches[0].header("If-Modified-Since"));
  EXPECT_EQ(fetches[1].header("If-Modified-Since"), time);
  for (const auto& fetch : fetches) {
    EXPECT_EQ(fetch.target, "/bags/zelko?version=7.4");
    EXPECT_EQ(fetch.header("User-Agent"), "veskreportingd/" + kVersion);
  }
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST_F(DaemonProcess, OwnsItsSocketAndStopsOnASignal) {
  harness.startDaemon();
  const pid_t pid = harness.daemon().pid();
  EXPECT_GE(::getpriority(PRIO_PROCESS, static_cast<id_t>(pid)), 5);
  for (const auto& task : std::filesystem::directory_iterator("/proc/" + std::to_string(pid) + "/task")) {
    EXPECT_EQ(::sched_getscheduler(std::stoi(task.path().filename())), SCHED_BATCH);
    const std::string status = harness.root.read((task.path() / "status").string());
    EXPECT_NE(status.find("\nNoNewPrivs:\t1\nSeccomp:\t2\n"), std::string::npos) << "in the sandbox";
  }
  rlimit descriptors{};
  EXPECT_EQ(::prlimit(pid, RLIMIT_NOFILE, nullptr, &descriptors), 0);
  EXPECT_EQ(descriptors.rlim_cur, descriptors.rlim_max);
  ChildProcess second({.command = {kDaemon, "--root", harness.root.path().string()},
                       .environment = {{"ASAN_OPTIONS", "detect_leaks=0"}}});  // it doesn't work in a sandbox
  EXPECT_EQ(second.wait(), 1);
  EXPECT_EQ(withoutTime(second.errors()),
            "<3> main: Another daemon answers on " + harness.socketPath() + ": Address already in use\n");
  EXPECT_EQ(harness.stopDaemon(), 0);
  const std::string log = harness.daemon().errors();
  EXPECT_TRUE(withoutTime(log).starts_with("<6> main: Listener resumes with sandbox, start loop.\n")) << log;
  EXPECT_NE(log.find(" veskreportingd[" + std::to_string(pid) + "] <6>"), std::string::npos);
}

TEST_F(DaemonProcess, WithoutItsSandboxSaysSoAndEndsWhenIdle) {
  harness.startDaemon({"--no-sandbox", "--idle-exit", "1", "--log-level", "6"});
  EXPECT_EQ(harness.daemon().wait(), 0);
  EXPECT_EQ(withoutTime(harness.daemon().errors()),
            "<6> main: Listener resumes without sandbox, start loop.\n");
}

TEST_F(DaemonProcess, TellsItsManagerHowItGoesAndKeepsToItsLimits) {
  FileDescriptor manager(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  UnixSocketAddress address(harness.root / "notify");
  ASSERT_EQ(::bind(manager.get(), address.get(), address.size()), 0);
  std::string status;  // the last that was told
  const auto notification = [&] {
    for (;;) {
      char text[256];
      const ssize_t size = ::recv(manager.get(), text, sizeof text, 0);
      std::string told(text, static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
      if (!told.starts_with("STATUS=")) return told;
      status = std::move(told);
    }
  };
  harness.setPreference("logRateLimit", "3");
  harness.setPreference("maxConnectionsPerUser", "2");
  harness.setPreference("maxHeldMiBPerUser", "1");
  HTTPAnswer storebag;
  storebag.body = signedStorebag(key, Dictionary{{"release", section("/post")}});
  serve(storebag);
  ::setenv("NOTIFY_SOCKET", (harness.root / "notify").c_str(), 1);
  harness.startDaemon();
  ::unsetenv("NOTIFY_SOCKET");
  EXPECT_EQ(notification(), "READY=1");
  // A client type without a storebag has no backend.
  RoadClient client(harness, {{kVeskReportingSessionInfoClientType, 4}});
  EXPECT_TRUE(client.reporting.sendMessageAndWait(message(3)));
  // A session that lacks its user info holds its messages.
  RoadClient holding(harness, {{kVeskReportingSessionInfoRequireUserInfo, true}});
  const auto bulk = message(3, {{"bulk", std::string(200 << 10, 'x')}});
  for (int i = 0; i < 6; ++i) EXPECT_TRUE(holding.reporting.sendMessageAndWait(bulk));
  VeskReporting third(harness.clientOptions());
  EXPECT_EQ(third.connect().status, ReportingStatus::TooManyConnections);
  harness.daemon().signal(SIGHUP);
  EXPECT_EQ(harness.daemon().wait(), 75) << "asks for a new start";
  EXPECT_EQ(notification(), "STOPPING=1");
  EXPECT_TRUE(status.starts_with("STATUS=2 connections, 0 posts wait, ")) << status;
  const std::string log = withoutTime(harness.daemon().errors());
  EXPECT_NE(log.find("<6> main: Lost since the start: httpPost over-bound "), log.npos) << log;
  EXPECT_NE(log.find("\n<6> main: Lost since the start: session no-backend 1\n"), log.npos) << log;
  EXPECT_NE(log.find("\n<7> log: Left out 4 lines of user "), log.npos) << log;
}

}  // namespace
}  // namespace vesk::test
