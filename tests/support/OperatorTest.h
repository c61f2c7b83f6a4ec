// The real daemon and collector, asked with veskreport.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {

/// The rest of a client entry that reports everything but "x".
inline constexpr char kReports[] =
    "locale_whitelist = [\"US\"]\nsampling_threshold = 1.0\npost_url = \"@EVENTS@\"\n"
    "[[release.httpPost.clients.filters]]\nkey = \"x\"\naction = \"remove\"\n";

class OperatorTest : public testing::Test {
 protected:
  struct Told {
    int status;
    std::string text;
  };
  Told ask(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin() + 1, {"--root", harness.root.path().string()});
    arguments.insert(arguments.begin(), VESK_BIN_DIRECTORY "/veskreport");
    ChildProcess tool(std::move(arguments));
    const int status = tool.wait().value_or(-1);
    return {status, tool.output() + tool.errors()};
  }
  RoadClient session(const char* name) {
    return RoadClient(harness, Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}},
                      Dictionary{{kVeskReportingUserInfoClientName, name}});
  }
  void start(const std::string& bag) {
    harness.writeStorebag("zelko",
                          "version = \"7\"\n[[release.httpPost.clients]]\nclient = \"Camera\"\n" + bag);
    harness.startDaemon();
  }
  static bool contains(const std::string& text, const std::string& part) {
    return text.find(part) != text.npos;
  }

  DaemonHarness harness;
};

}  // namespace vesk::test
