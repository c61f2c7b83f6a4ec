// Tests of sessions that are driven directly.
#pragma once

#include <gtest/gtest.h>

#include <sstream>

#include "tests/support/AgentHarness.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {

inline const Dictionary kCamera{{kVeskReportingUserInfoClientName, "Camera"},
                                {kVeskReportingUserInfoServiceName, "Clips"}};

inline bool contains(std::string_view text, std::string_view part) { return text.find(part) != text.npos; }

class Session : public ::testing::Test {
 protected:
  Session() {
    writeFacts("DeviceName = \"Phone\"\nProductType = \"Phone7,2\"\n");
    harness.storebags[5] = storebag("httpPost");
  }
  static void writeFacts(const std::string& facts) {
    testRoot().write("etc/veskreporting/device.toml", facts);
  }
  /// A section with the named backends. "+" adds a display URL (http:// and the name); "~" makes the backend
  /// hold its messages for a batch. A name may occur twice.
  Dictionary storebag(const std::string& backends) const {
    MutableDictionary section;
    std::istringstream words(backends);
    for (std::string name; words >> name;) {
      const std::string marks = name.substr(std::min(name.size(), name.find_first_of("+~")));
      name.resize(name.size() - marks.size());
      Dictionary entry{{"post_url", harness.url()}, {"ip", "127.0.0.1"}, {"port", 9}};
      if (contains(marks, "~")) entry = merged(entry, Dictionary{{"expedite", 0}});
      MutableDictionary profile(merged(entry, Dictionary{{"clients", List{entry}}}));
      if (contains(marks, "+")) profile.set("display_url", "http://" + name);
      section.append(Text(name), profile.share());
    }
    return section.share();
  }
  DrivenSession configured(const Dictionary& info = {},
                           const std::optional<Dictionary>& userInfo = std::nullopt) {
    auto session = harness.newSession();
    session->setSessionInfo(merged(identified(5), info), userInfo, {}, false);
    return session;
  }
  DrivenSession started(const Dictionary& section, const Dictionary& info = {}) {
    harness.storebags[5] = section;
    harness.clock.advance(std::chrono::hours(2));
    auto session = configured(info);
    session.start();
    harness.posts();
    return session;
  }
  static Dictionary identified(Value clientType, Value sessionID = 77) {
    return Dictionary{{kVeskReportingSessionInfoSessionID, sessionID},
                      {kVeskReportingSessionInfoClientType, clientType}};
  }
  static Dictionary message(Value category, Value type, Dictionary payload = {}) {
    return Dictionary{{"category", category}, {"type", type}, {"payload", payload}};
  }
  static std::string sendOnce(DrivenSession& session, const Dictionary& info,
                              const std::optional<Dictionary>& userInfo = std::nullopt) {
    std::string answer;
    session->sendMessageWithSessionInfo(
        info, userInfo, 4, 5, Dictionary{{"a", 1}},
        {[&](const std::string& reply) { answer = reply; }, [&] { answer = "no answer"; }});
    return answer;
  }
  boost::json::object lastEvent() { return harness.posts().back().event(); }
  /// What `act` adds to the message log.
  template <class Act>
  static std::string logged(Act act) {
    constexpr char kDirectory[] = "var/mobile/Library/Logs/Dunmore/Retired";
    std::filesystem::remove_all(testRoot() / kDirectory);
    act();
    return testRoot().readAll(kDirectory);
  }

  AgentHarness harness;
};

}  // namespace vesk::test
