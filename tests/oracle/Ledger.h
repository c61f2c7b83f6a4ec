// What was promised, what arrived, and the daemons' own accounts of their losses.
#pragma once

#include <cstdint>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

namespace vesk::test {

/// How a daemon ended.
enum class DaemonEnd : std::uint8_t {
  Terminated,  ///< by SIGTERM: it reported its losses
  Killed,      ///< by SIGKILL: what it held is lost without a report
};

/// The oracle's books, with one account for each daemon that ran ("incarnation", from 1).
///
/// A message is *accepted* by a daemon if its client reported it as confirmed (`OracleClient`).
///
/// A loss is *covered* if the daemon counted it. The counters (`util/Counters.h`) tell how many events were
/// lost, but not which: of the messages that a daemon accepted, at most the total of its final lines ("main:
/// Lost since the start: BACKEND REASON COUNT") may be missing. The counters also include the sessions' own
/// start and end messages and messages that were never confirmed, so these can hide a loss. The fewer drops
/// are counted, the sharper the judgement; without drops it is exact. A post that waits on disk may be lost
/// under a later daemon, so those losses cover the messages of any. What a killed daemon may lose is
/// shown.
///
/// Every message that arrives, accepted or not, is checked to be *unchanged*.
class Ledger {
 public:
  /// What a killed daemon may lose.
  enum class Kills : std::uint8_t {
    MayLose,     ///< anything, since the collector refuses posts, and its counts of that end with it
    LoseRecent,  ///< what it accepted in its last six seconds
    LoseNothing
  };
  explicit Ledger(Kills kills) : _kills(kills) {}

  void daemonEnded(std::uint64_t incarnation, DaemonEnd end, std::string_view log);
  void clientReported(std::string_view output);
  /// Reads what was added to the collector's event file since the last call.
  void readEvents(const std::string& path);
  bool hasArrived(std::int64_t id) const { return _arrived.contains(id); }

  /// Whether the terminated daemons' losses are covered by what has arrived so far.
  bool isCovered() const;

  /// Prints the accounts. Returns true if every daemon's losses are covered, no message was changed, and
  /// messages were accepted, including some after a restart.
  bool judge() const;

 private:
  struct Account {
    DaemonEnd end = DaemonEnd::Killed;
    std::uint64_t counted = 0;
    std::uint64_t countedLate = 0;  ///< of posts that had waited on disk
    std::string reasons;
    std::map<std::int64_t, double> accepted;  ///< seconds of the steady clock, by message
    double ended = 0;                         ///< by the same clock
  };
  void readEvent(const std::string& line);
  std::vector<std::int64_t> missing(const Account& account) const;
  /// The number of its messages that neither arrived nor were counted; 0 for a killed daemon.
  std::size_t uncovered(const Account& account) const;
  void print(std::uint64_t incarnation, const Account& account) const;

  const Kills _kills;
  std::map<std::uint64_t, Account> _accounts;
  std::unordered_set<std::int64_t> _arrived;
  std::vector<std::string> _changed;
  std::uint64_t _again = 0;
  std::streamoff _read = 0;
};

}  // namespace vesk::test
