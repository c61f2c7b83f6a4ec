// The daemon on a failing machine: disks, descriptors and memory.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/resource.h>

#include <algorithm>

#include "tests/support/DaemonHarness.h"
#include "tests/support/ProcessFacts.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

/// A small file system that only this process and its children see, and that disappears with them.
class SmallDisk {
 public:
  SmallDisk(const std::filesystem::path& at, const char* size) : _at(at) {
    _isMounted = ::unshare(CLONE_NEWNS) == 0 &&
                 ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
                 ::mount("tmpfs", _at.c_str(), "tmpfs", 0, (std::string("size=") + size).c_str()) == 0;
  }
  ~SmallDisk() {
    if (_isMounted) ::umount2(_at.c_str(), MNT_DETACH);
  }
  SmallDisk(const SmallDisk&) = delete;
  SmallDisk& operator=(const SmallDisk&) = delete;

  bool isMounted() const { return _isMounted; }
  void makeReadOnly() {
    ASSERT_EQ(::mount("none", _at.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  }
  void fill() {
    std::ofstream file(_at / "filler");
    while (file << std::string(4096, 'x') << std::flush) {
    }
  }

 private:
  std::filesystem::path _at;
  bool _isMounted = false;
};

constexpr char kLogs[] = "var/mobile/Library/Logs/Dunmore";
constexpr char kState[] = "var/lib/veskreportingd";

struct DiskCase {
  const char* what;
  const char* directory;
  void (*breakIt)(const DaemonHarness& harness, SmallDisk* disk);
  bool needsDisk;
  const char* line;  // the daemon's log line
};

const DiskCase kDiskCases[] = {
    {"the log directory is a file", kLogs,
     [](const DaemonHarness& harness, SmallDisk*) {
       harness.root.write(std::string(kLogs) + "/Retired", "x");
     },
     false, "writeToLogFile: Error reading from log directory: Not a directory"},
    {"the log directory can't be made", kLogs,
     [](const DaemonHarness&, SmallDisk* disk) { disk->makeReadOnly(); }, true,
     "writeToLogFile: Failed to create new veskreportingd log file"},
    {"no room for the log", kLogs, [](const DaemonHarness&, SmallDisk* disk) { disk->fill(); }, true,
     "writeToLogFile: Deleted expired veskreportingd log file"},
    {"the identifiers can't be kept", kState,
     [](const DaemonHarness&, SmallDisk* disk) { disk->makeReadOnly(); }, true, "cannot keep identifiers in"},
    {"no room for the identifiers", kState, [](const DaemonHarness&, SmallDisk* disk) { disk->fill(); }, true,
     "cannot keep identifiers in"},
};

TEST(Machine, ADiskThatFailsCostsNoMessage) {
  for (const auto& test : kDiskCases) {
    SCOPED_TRACE(test.what);
    DaemonHarness harness;
    std::optional<SmallDisk> disk;
    if (test.needsDisk) {
      disk.emplace(harness.root / test.directory, "64k");
      if (!disk->isMounted()) GTEST_SKIP() << "needs the right to mount";
    }
    test.breakIt(harness, disk ? &*disk : nullptr);
    harness.startDaemon();
    RoadClient client(harness);
    for (int i = 0; i < 5; ++i) {
      auto sent = client.reporting.sendMessageAndWait(message(3));
      ASSERT_TRUE(sent) << sent.detail;
      EXPECT_TRUE(sent.answer) << "the client is told what was posted, the log or no log";
    }
    harness.waitForEventsOfMethod(3, 5);
    EXPECT_TRUE(harness.daemon().waitForText(test.line));
    EXPECT_EQ(harness.stopDaemon(), 0);
  }
}

void limit(const ChildProcess& process, __rlimit_resource resource, rlim_t to) {
  rlimit before{};
  ASSERT_EQ(::prlimit(process.pid(), resource, nullptr, &before), 0);
  const rlimit after{std::min(to, before.rlim_max), before.rlim_max};
  ASSERT_EQ(::prlimit(process.pid(), resource, &after, nullptr), 0);
}

TEST(Machine, WithoutDescriptorsItGoesOnAndForgetsNothing) {
  if (kIsSanitized) GTEST_SKIP() << "the sanitizer opens pipes to look at memory, and complains without";
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  limit(harness.daemon(), RLIMIT_NOFILE, 3);
  // Posts, the message log and new clients all fail to get a descriptor.
  harness.stopCollector();
  for (int i = 0; i < 20; ++i) {
    auto sent = client.reporting.sendMessageAndWait(message(3, Dictionary{{"n", i}}));
    ASSERT_TRUE(sent) << sent.detail;
  }
  VeskReporting refused(harness.clientOptions());
  EXPECT_EQ(refused.connect(500ms).status, ReportingStatus::NotConnected);
  harness.startCollector();
  limit(harness.daemon(), RLIMIT_NOFILE, RLIM_INFINITY);
  harness.waitForEventsOfMethod(3, 20);
  EXPECT_TRUE(refused.connect(ChildProcess::kPatience)) << "by itself, once there is room";
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST(Machine, WithoutMemoryItSaysSoAndEnds) {
  if (kIsSanitized) GTEST_SKIP() << "the sanitizer has an allocator of its own";
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  limit(harness.daemon(), RLIMIT_DATA, 1);  // 0 would be no limit
  EXPECT_FALSE(client.reporting.sendMessageAndWait(message(3, {{"text", std::string(900'000, 'x')}})));
  EXPECT_EQ(harness.daemon().wait(), EXIT_FAILURE);
  EXPECT_NE(harness.daemon().errors().find("<3>main: Out of memory, ending\n"), std::string::npos);
}

}  // namespace
}  // namespace vesk::test
