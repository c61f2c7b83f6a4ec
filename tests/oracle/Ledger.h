// What was promised, what arrived, and what the daemons say they lost.
#pragma once

#include <cstdint>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

namespace vesk::test {

/// How one daemon ended.
enum class DaemonEnd : std::uint8_t {
  Terminated,  ///< by SIGTERM: it said what it lost
  Killed,      ///< by SIGKILL: what it held is gone, and nobody could say so
};

/// The oracle's books, one account for each daemon that ran ("incarnation", from 1).
///
/// *Accepted* by a daemon is a message that its client reported as confirmed (`OracleClient`).
///
/// *Covered* is a loss that the daemon counted. The counters (`util/Counters.h`) know how many events were
/// lost, not which: of the messages that a daemon accepted, at most as many may be missing as the lines that
/// it writes at its end
/// ("main: Lost since the start: BACKEND REASON COUNT") add up to. They also count the sessions' own start
/// and end messages and messages that were never confirmed, so a loss could hide behind these; the fewer
/// drops are counted, the sharper the judgement, and with none it is exact. Losses of a killed daemon are
/// excused, and shown.
///
/// *Unchanged* is checked of every message that arrived, accepted or not.
class Ledger {
 public:
  void daemonEnded(std::uint64_t incarnation, DaemonEnd end, std::string_view log);
  void clientReported(std::string_view output);
  /// Reads what the collector's event file has more since the last time.
  void readEvents(const std::string& path);
  bool hasArrived(std::int64_t id) const { return _arrived.contains(id); }

  /// Prints the accounts. True when every daemon's losses are covered, nothing was changed, and messages were
  /// accepted at all, also by those who came back after a restart.
  bool judge() const;

 private:
  struct Account {
    DaemonEnd end = DaemonEnd::Killed;
    std::uint64_t counted = 0;
    std::string reasons;
    std::vector<std::int64_t> accepted;
  };
  void readEvent(const std::string& line);
  bool judge(std::uint64_t incarnation, const Account& account) const;

  std::map<std::uint64_t, Account> _accounts;
  std::unordered_set<std::int64_t> _arrived;
  std::vector<std::string> _changed;
  std::uint64_t _again = 0;
  std::streamoff _read = 0;
};

}  // namespace vesk::test
