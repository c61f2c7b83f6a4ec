// The oracle's faults while the clients send.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "tests/oracle/Ledger.h"
#include "tests/oracle/SharedPage.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/DaemonHarness.h"

namespace vesk::test {

/// Runs daemon, collector and clients, and disturbs them by a plan that depends only on the seed. Throws
/// std::runtime_error if a process misbehaves (a crash, a wrong exit status, an end that takes too long).
class FaultRun {
 public:
  struct Options {
    std::uint64_t seed = 1;
    std::int64_t seconds = 25;
    std::size_t clients = 4;
    bool always = false;  ///< the daemons write each post before they send it; most faults are kills
  };
  /// Starts everything.
  explicit FaultRun(Options options);

  void disturb();
  /// Ends the faults and lets all held messages out: the clients end, a fresh message arrives, the daemon is
  /// terminated. Returns true if everything promised has arrived.
  bool judge();

 private:
  void injectOne();
  void answerBadly();
  void stallPosts();
  void collectorAway();
  void freeze(const char* what, const ChildProcess& process);
  void killClient();
  void replaceDaemon(DaemonEnd end);
  /// Starts another daemon while the collector is away.
  void reboot(DaemonEnd end);

  void startDaemon();
  void endDaemon(DaemonEnd end);
  void restartCollector();
  void startClient(std::size_t index);
  /// Waits for the client and reads its report. Returns false if it does not end or its status is not
  /// `status`.
  bool clientEnded(std::size_t index, int status);
  void sendFreshMessage();

  void say(const std::string& what) const;
  std::uint64_t upTo(std::uint64_t most) { return 1 + _random() % most; }
  void pause(std::uint64_t least, std::uint64_t most);  // milliseconds

  const Options _options;
  std::mt19937_64 _random;
  DaemonHarness _harness;
  const SharedPage _page;
  const bool _isRefusing;  ///< the collector refuses some posts
  Ledger _ledger;
  std::vector<std::unique_ptr<ChildProcess>> _clients;
  std::int64_t _clientsStarted = 0;
  const std::chrono::steady_clock::time_point _begun = std::chrono::steady_clock::now();
};

}  // namespace vesk::test
