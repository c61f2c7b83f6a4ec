// File uploads through the full pipeline: an untrustworthy client, the daemon in its sandbox, a collector.
#include <fcntl.h>
#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <future>
#include <thread>

#include "platform/files/FileDescriptor.h"
#include "tests/support/DaemonHarness.h"
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
  /// A saved upload, decompressed.
  std::optional<std::string> saved(const std::string& name) const {
    HTTPReceived upload;
    upload.headers = {{"Content-Encoding", "gzip"}};
    upload.body = harness.root.read("collector/uploads/" + name);
    return upload.decodedBody().body;
  }
  std::int64_t uploads() { return harness.collectorCount("uploads"); }
  DaemonHarness harness;
  const fs::path spool = harness.root / "var/spool/veskreporting";
};

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

TEST_F(UploadRoad, AFileThatShrinksIsRefusedAndOneThatGrowsIsSentAndStays) {
  RoadClient client(harness);
  for (int step : {1, -1}) {
    const std::string path = file(step > 0 ? "growing" : "shrinking");
    off_t size = static_cast<off_t>(step > 0 ? kMiB : 96 * kMiB);  // large: it must shrink while it is read
    FileDescriptor descriptor(::open(path.c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(::ftruncate(descriptor.get(), size), 0);
    if (step > 0) harness.setFault("upload=slow");  // it must grow before the answer arrives
    std::atomic<bool> stop{false};
    std::thread changing([&] {
      while (!stop) {
        size += step;
        EXPECT_EQ(::ftruncate(descriptor.get(), size), 0);
      }
    });
    EXPECT_EQ(client.reporting.uploadFile(path, ChildProcess::kPatience).answer, step > 0);
    stop = true;
    changing.join();
    EXPECT_EQ(fs::file_size(path), static_cast<std::uintmax_t>(size));
    EXPECT_EQ(uploads(), 1);
  }
  EXPECT_TRUE(harness.daemon().waitForText("Input file has shrunk while it was uploaded"));
}

TEST_F(UploadRoad, ServersThatHangStopNeitherOtherSessionsNorTheEnd) {
  ASSERT_EQ(harness.stopDaemon(), 0);
  harness.startDaemon({"--log-level", "6"});  // with debug lines, a connection would wait for the fetch
  const std::string path = file("hung");
  RoadClient uploading(harness);
  RoadClient other(harness);
  harness.setFault("upload=stall");
  auto answer = std::async(std::launch::async,
                           [&] { return uploading.reporting.uploadFile(path, ChildProcess::kPatience); });
  while (harness.collectorCount("faults") == 0) std::this_thread::yield();
  EXPECT_TRUE(other.reporting.fetchStates(Dictionary{{kVeskReportingUserInfoClientName, "x"}}));
  EXPECT_TRUE(other.reporting.flushMessagesAndWait());
  harness.setFault("storebag=stall");
  std::vector<std::future<void>> clients;
  for (int type : {6, 8}) {
    clients.push_back(std::async(std::launch::async, [&, type] {
      VeskReporting client(harness.clientOptions());
      (void)client.setSessionInfo(Dictionary{{kVeskReportingSessionInfoClientType, type}});
      (void)client.startConfig(ChildProcess::kPatience);
    }));
  }
  while (harness.collectorCount("faults") == 1) std::this_thread::yield();
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(harness.daemon().waitForText("UploadBackend(uploadFileAtPath): post the daemon stops"));
  EXPECT_TRUE(harness.daemon().waitForText("sendSynchronousRequest error the client was stopped"));
  EXPECT_EQ(harness.daemon().errors().find("timed out"), std::string::npos);
  answer.wait();
  EXPECT_TRUE(fs::exists(path));
}

}  // namespace
}  // namespace vesk::test
