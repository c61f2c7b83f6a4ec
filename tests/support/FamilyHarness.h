// An agent whose sessions form families.
#pragma once

#include <gtest/gtest.h>

#include "tests/support/AgentHarness.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {

/// Client types 5 to 8 are levels 0 to 3 of one family.
class FamilyHarness : public ::testing::Test {
 protected:
  FamilyHarness() {
    testRoot().write("etc/veskreporting/device.toml", "DeviceName = \"Phone\"\n");
    for (int level = 0; level < 4; ++level)
      harness.storebags[5 + level] = Dictionary{{"httpPost", profile(level, level == 0 ? 1.0 : 0.0)}};
  }
  Dictionary profile(int level, double threshold) {
    return Dictionary{{"clients", List{Dictionary{{"post_url", harness.url()},
                                                  {"hierarchy", level},
                                                  {"locale_whitelist", List{"US"}},
                                                  {"filters", List{Dictionary()}},
                                                  {"override_sampling", 0.0},
                                                  {"sampling_threshold", threshold}}}}};
  }
  DrivenSession join(int level, bool aggregates = false, const char* client = "MyApp", bool batches = false) {
    auto session = harness.newSession();
    session->setSessionInfo(sessionInfo(level, batches), userInfo(client), {}, aggregates);
    names = session.start();
    return session;
  }
  static Dictionary sessionInfo(int level, bool batches = false) {
    return Dictionary{{kVeskReportingSessionInfoSessionID, 100 + level},
                      {kVeskReportingSessionInfoClientType, 5 + level},
                      {kVeskReportingSessionInfoRequireUserInfo, true},
                      {kVeskReportingSessionInfoBatchEvent, batches}};
  }
  static Dictionary userInfo(const char* client) {
    return Dictionary{{kVeskReportingUserInfoClientName, client},
                      {kVeskReportingUserInfoServiceName, "Calls"}};
  }
  /// A realtime message, unless another flag is given.
  static Dictionary message(int flag = 1, std::string text = "text") {
    return Dictionary{
        {"category", 3}, {"type", 2}, {"flag", flag}, {"payload", Dictionary{{"a", std::move(text)}}}};
  }
  std::string lastSessionID() {
    return std::string(harness.posts().back().event().at("_sessionID").as_string());
  }

  AgentHarness harness;
  std::optional<BackendNames> names;  // the answer to the last start
};

}  // namespace vesk::test
