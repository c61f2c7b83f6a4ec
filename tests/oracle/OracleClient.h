// One client process of the oracle.
#pragma once

#include <VeskReporting/VeskReporting.h>

#include <cstdint>
#include <random>
#include <string>

#include "tests/oracle/SharedPage.h"

namespace vesk::test {

/// Sends messages in all kinds of sessions until the page says stop. Reports on standard output what the
/// daemon confirmed, one line per range: "accepted FIRST LAST INCARNATION". It may be killed at any time;
/// what it has written remains valid.
///
/// A message is confirmed if its own answer came, or, for a one-way message, if the answer to a later flush
/// came, and everything was sent and answered during the life of one daemon.
class OracleClient {
 public:
  /// Numbers its messages from `firstID`, which also seeds its random choices.
  OracleClient(std::string socketPath, const std::string& pagePath, std::int64_t firstID);

  /// Returns the process's exit status.
  int run();

 private:
  void runSession();
  bool start(VeskReporting& session);
  bool sendOneWay(VeskReporting& session, int flag);
  bool sendAnswered(VeskReporting& session);
  bool sendOnce(VeskReporting& session);
  /// Reports the messages from `first` on if the current daemon is still that of `incarnation`.
  void confirm(std::int64_t first, std::uint64_t incarnation);
  std::uint64_t upTo(std::uint64_t most) { return 1 + _random() % most; }

  const std::string _socketPath;
  const SharedPage _page;
  std::int64_t _nextID;
  std::mt19937_64 _random;
};

}  // namespace vesk::test
