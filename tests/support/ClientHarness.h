// Tests of clients against a daemon that only records calls.
#pragma once

#include <VeskReporting/VeskReporting.h>
#include <gtest/gtest.h>

#include "tests/support/RecordingDaemon.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {

/// No daemon runs until a test starts one.
class ClientHarness : public testing::Test {
 protected:
  ReportingOptions options() const {
    ReportingOptions options;
    options.socketPath = socket;
    options.firstReconnectWait = std::chrono::milliseconds(5);
    options.lastReconnectWait = std::chrono::milliseconds(20);
    options.drainTime = std::chrono::minutes(1);
    return options;
  }

  const Dictionary sessionInfo{{kVeskReportingSessionInfoSessionID, 7U},
                               {kVeskReportingSessionInfoClientType, 3}};
  TempDirectory directory;
  std::string socket = directory / "run/socket";
  Record record;
  std::optional<RecordingDaemon> daemon;
};

}  // namespace vesk::test
