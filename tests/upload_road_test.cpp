// Files on the whole road: a client that can be trusted with nothing, the daemon in its sandbox, a collector.
#include <fcntl.h>
#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <future>
#include <random>
#include <thread>

#include "client/protocol/WireNames.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/IPCHarness.h"
#include "tools/collector/HTTPMessage.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kMiB = std::uint64_t{1} << 20;

/// A daemon whose clients upload to its collector.
class UploadRoad : public testing::Test {
 protected:
  UploadRoad() {
    fs::create_directories(spool);
    harness.writeStorebag(
        "zelko", "version = \"1\"\n[[release.httpPost.clients]]\n[release.uploadServer]\npost_url = \"" +
                     harness.fact("uploadsURL") + "\"\n");
    harness.startDaemon();
  }

  std::string file(const std::string& name, const std::string& contents = "contents") const {
    return harness.root.write("var/spool/veskreporting/" + name, contents).string();
  }
  /// An upload as the collector unpacks it.
  std::optional<std::string> saved(const std::string& name) const {
    HTTPReceived upload;
    upload.headers = {{"Content-Encoding", "gzip"}};
    upload.body = harness.root.read("collector/uploads/" + name);
    return upload.decodedBody().body;
  }
  std::int64_t uploads() { return harness.collectorCount("uploads"); }
  /// The peak of the daemon's memory, in bytes.
  std::uint64_t peak() const {
    std::ifstream status("/proc/" + std::to_string(harness.daemon().pid()) + "/status");
    for (std::string word; status >> word;) {
      std::uint64_t kibibytes = 0;
      if (word == "VmHWM:" && status >> kibibytes) return kibibytes << 10;
    }
    return 0;
  }

  DaemonHarness harness;
  const fs::path spool = harness.root / "var/spool/veskreporting";
};

/// Says of a file what it likes.
class LyingClient {
 public:
  explicit LyingClient(const DaemonHarness& harness) : _client(harness.socketPath()) {
    const Dictionary info{{kVeskReportingSessionInfoSessionID, 9}, {kVeskReportingSessionInfoClientType, 5}};
    _client.call("setSessionInfo", {info, std::optional<Dictionary>(), std::vector<std::string>(), false});
    EXPECT_EQ(_client.call("startConfigWithCompletionHandler"), "httpPost,uploadServer");
  }
  std::string upload(const std::string& path, int descriptor) {
    return _client.call("uploadFileAtPath", {"file://" + path, IPCDescriptor{descriptor}});
  }
  TestClient& bus() { return _client; }

 private:
  TestClient _client;
};

FileDescriptor opened(const std::string& path, int flags = O_RDONLY) {
  return FileDescriptor(::open(path.c_str(), flags | O_CLOEXEC | O_NONBLOCK));
}

TEST_F(UploadRoad, TheFileArrivesAndIsGoneWhereTheSandboxAllowsIt) {
  RoadClient client(harness);
  EXPECT_EQ(client.enabled, (BackendNames{"httpPost", "uploadServer"}));
  const std::string path = file("a b.log", std::string(100'000, 'x') + "end");
  auto answer = client.reporting.uploadFile(path);
  EXPECT_TRUE(answer && answer.answer) << answer.detail;
  EXPECT_FALSE(fs::exists(path));
  EXPECT_EQ(saved("1-a b.log.gz"), std::string(100'000, 'x') + "end");

  const std::string elsewhere = harness.root.write("elsewhere/b.log", "contents").string();
  EXPECT_TRUE(client.reporting.uploadFile(elsewhere).answer);
  EXPECT_TRUE(fs::exists(elsewhere)) << "left, without a failure";
  EXPECT_EQ(uploads(), 2);
  EXPECT_NE(harness.messageLog().find("[uploadFileWithURL] Upload succeeded for file file://"),
            std::string::npos);
}

TEST_F(UploadRoad, HostileFilesAreRefusedAndNothingIsLost) {
  LyingClient client(harness);
  const std::string plain = file("plain");
  const std::string secret = harness.root.write("secret", "of the daemon's machine").string();
  EXPECT_EQ(client.upload(secret, -1), "false") << "no token";
  EXPECT_TRUE(harness.daemon().waitForText("Only upload a regular file."));
  EXPECT_EQ(client.bus().call("uploadFileAtPath", {"file://" + secret, std::string(32, 'a')}), "InvalidArgs")
      << "a token is nothing that a client could send";
  EXPECT_EQ(uploads(), 0);
  FileDescriptor foreign = opened(plain);
  EXPECT_EQ(client.upload(secret, foreign.get()), "true") << "the bytes are the descriptor's";
  EXPECT_EQ(client.upload(plain, foreign.get()), "true") << "a second call has a token of its own";
  EXPECT_TRUE(fs::exists(secret));
  EXPECT_FALSE(fs::exists(plain));
  EXPECT_EQ(saved("1-secret.gz"), "contents");
}

TEST_F(UploadRoad, AFileThatShrinksIsRefusedAndOneThatGrowsIsSentAndStays) {
  LyingClient client(harness);
  for (int step : {1, -1}) {
    const std::string path = file(step > 0 ? "growing" : "shrinking");
    off_t size = static_cast<off_t>(step > 0 ? kMiB : 96 * kMiB);  // large: it must shrink while it is read
    FileDescriptor descriptor = opened(path, O_RDWR);
    ASSERT_EQ(::ftruncate(descriptor.get(), size), 0);
    if (step > 0) harness.setFault("upload=slow");  // it must grow before the answer is there
    std::atomic<bool> stop{false};
    std::thread changing([&] {
      while (!stop) {
        size += step;
        EXPECT_EQ(::ftruncate(descriptor.get(), size), 0);
      }
    });
    EXPECT_EQ(client.upload(path, descriptor.get()), step > 0 ? "true" : "false");
    stop = true;
    changing.join();
    EXPECT_EQ(fs::file_size(path), static_cast<std::uintmax_t>(size));
    EXPECT_EQ(uploads(), 1);
  }
  EXPECT_TRUE(harness.daemon().waitForText("Input file has shrunk while it was uploaded"));
}

TEST_F(UploadRoad, AServerThatHangsStopsNeitherOtherSessionsNorTheEnd) {
  const std::string path = file("hung");
  RoadClient uploading(harness);
  harness.setFault("upload=stall");
  auto answer = std::async(std::launch::async,
                           [&] { return uploading.reporting.uploadFile(path, ChildProcess::kPatience); });
  while (harness.collectorCount("faults") == 0) std::this_thread::yield();
  RoadClient other(harness);
  EXPECT_TRUE(other.reporting.fetchStates(Dictionary{{kVeskReportingUserInfoClientName, "x"}}));
  EXPECT_TRUE(other.reporting.flushMessagesAndWait());
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(harness.daemon().waitForText("UploadBackend(uploadFileAtPath): post the daemon stops"));
  answer.wait();
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(UploadRoad, AStorebagServerThatHangsDoesNotHoldUpTheEnd) {
  ASSERT_EQ(harness.stopDaemon(), 0);
  harness.startDaemon({"--log-level", "6"});  // with debug lines, a connection would wait for the fetch
  harness.setFault("storebag=stall");
  std::vector<std::future<void>> clients;
  for (int type : {5, 6, 8}) {
    clients.push_back(std::async(std::launch::async, [&, type] {
      VeskReporting client(harness.clientOptions());
      (void)client.setSessionInfo(Dictionary{{kVeskReportingSessionInfoClientType, type}});
      (void)client.startConfig(ChildProcess::kPatience);
    }));
  }
  while (harness.collectorCount("faults") == 0) std::this_thread::yield();
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(harness.daemon().waitForText("sendSynchronousRequest error the client was stopped"));
  EXPECT_EQ(harness.daemon().errors().find("timed out"), std::string::npos);
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
TEST_F(UploadRoad, TakesNoMoreMemoryThanTheFileAndItsCompressedForm) {
  RoadClient client(harness);
  std::string noise(40 * kMiB, '\0');
  std::minstd_rand random(1);
  for (char& c : noise) c = static_cast<char>(random() >> 8);
  struct Case {
    const char* name;
    const char* saved;
    std::string contents;
  };
  for (const auto& test : {Case{"even", "collector/uploads/1-even.gz", std::string(80 * kMiB, 'e')},
                           Case{"noise", "collector/uploads/2-noise.gz", noise}}) {
    const std::string path = file(test.name, test.contents);
    std::ofstream("/proc/" + std::to_string(harness.daemon().pid()) + "/clear_refs") << "5";
    const std::uint64_t before = peak();
    EXPECT_TRUE(client.reporting.uploadFile(path, ChildProcess::kPatience).answer);
    const std::uint64_t compressed = fs::file_size(harness.root / test.saved);
    EXPECT_LE(peak() - before, test.contents.size() + compressed + 16 * kMiB) << test.name;
  }
}
#endif

}  // namespace
}  // namespace vesk::test
