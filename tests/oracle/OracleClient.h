// One client process of the oracle.
#pragma once

#include <VeskReporting/VeskReporting.h>

#include <cstdint>
#include <random>
#include <string>

#include "tests/oracle/SharedPage.h"

namespace vesk::test {

/// Sends messages in sessions of all kinds until the page says stop, and reports on standard output what the
/// daemon confirmed, one line a range: "accepted FIRST LAST INCARNATION". It may be killed at any moment;
/// what it has written then counts.
///
/// Confirmed are a message whose own answer came, and one-way messages in front of a flush whose answer came,
/// all sent and answered while one daemon lived.
class OracleClient {
 public:
  /// Numbers its messages from `firstID`; the same one decides what it does.
  OracleClient(std::string socketPath, const std::string& pagePath, std::int64_t firstID);

  /// The process's exit status.
  int run();

 private:
  void runSession();
  bool start(VeskReporting& session);
  bool sendOneWay(VeskReporting& session, int flag);
  bool sendAnswered(VeskReporting& session);
  bool sendOnce(VeskReporting& session);
  /// Reports the messages from `first` on when the daemon that is there now was there at `incarnation`.
  void confirm(std::int64_t first, std::uint64_t incarnation);
  std::uint64_t upTo(std::uint64_t most) { return 1 + _random() % most; }

  const std::string _socketPath;
  const SharedPage _page;
  std::int64_t _nextID;
  std::mt19937_64 _random;
};

}  // namespace vesk::test
