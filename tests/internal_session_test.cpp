// Sessions on an internal build. A separate program, since a process determines its kind of build once.
#include <gtest/gtest.h>

#include "tests/support/AgentHarness.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

void writeFacts(const std::string& more) {
  testRoot().write("etc/veskreporting/device.toml", "ReleaseType = \"Internal\"\n" + more);
}

TEST(InternalSession, TheStartMessageDescribesTheDeviceAndBackendsKnowTheBuild) {
  writeFacts("");
  EXPECT_EQ(describe(deviceDictionary("7.0", std::nullopt)),
            R"({"SerialNum": "Unknown", "Version": "Unknown", "Build": "Unknown", "Hardware": "Unknown", )"
            R"("Product": "Unknown", "ReportVers": "7.0", "AutomaticTimeSet": true})");
  writeFacts(R"(SerialNumber = "S1"
ProductVersion = "12.4"
BuildVersion = "16G77"
HWModelStr = "D22AP"
DeviceName = "Phone")");
  AgentHarness harness;
  const Dictionary entry{{"post_url", harness.url()}, {"extras_on_internal", 1}};
  harness.storebags[7] = Dictionary{{"httpPost", Dictionary{{"clients", List{entry}}}}};
  auto session = harness.newSession();
  session->setSessionInfo(
      Dictionary{{kVeskReportingSessionInfoSessionID, 77}, {kVeskReportingSessionInfoClientType, 7}},
      std::nullopt, {}, false);
  session.start();
  session.flush();
  const auto event = harness.posts().at(0).event();
  const auto device = boost::json::parse(R"({"SerialNum": "S1", "Version": "12.4", "Build": "16G77",
      "Hardware": "D22AP", "Product": "Phone", "ReportVers": "7.3", "Locale": "US", "AutomaticTimeSet": true})");
  for (const auto& [key, value] : device.as_object()) EXPECT_EQ(event.at(key), value) << key;
  session.send(Dictionary{{"category", 1}, {"type", 2}});
  EXPECT_EQ(harness.posts().back().event().at("_sessionID"), 77) << "an extra of internal builds";
}

}  // namespace
}  // namespace vesk::test
