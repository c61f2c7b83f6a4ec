#include "tests/oracle/Ledger.h"

#include <algorithm>
#include <boost/json.hpp>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <iterator>
#include <regex>
#include <sstream>

#include "tests/oracle/OracleMessage.h"

namespace vesk::test {

namespace {

constexpr double kRecent = 6;  // seconds
constexpr std::string_view kLossLine = "main: Lost since the start: ";

// Losses of events that the collector should have received or that had no backend; not uploads, datagrams or
// records.
bool concernsEvents(std::string_view backend, std::string_view reason) {
  return backend == "httpPost" || reason == "no-backend" || reason == "invalid-message";
}

/// Of a post that had waited on disk, perhaps under an earlier daemon.
bool isLate(std::string_view reason) {
  return reason == "refused" || reason == "expired" || reason == "over-quota" ||
         reason == "consent-withdrawn" || reason == "damaged" || reason == "not-written";
}

}  // namespace

void Ledger::daemonEnded(std::uint64_t incarnation, DaemonEnd end, std::string_view log) {
  Account& account = _accounts[incarnation];
  account.end = end;
  account.ended = std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
  if (end == DaemonEnd::Killed) {  // it reported no counts
    static const std::regex refused(" refused ([0-9]+) events that had waited");
    const std::string text(log);
    for (std::sregex_iterator each(text.begin(), text.end(), refused), none; each != none; ++each)
      account.countedLate += std::stoull((*each)[1]);
  }
  for (std::size_t at = 0; (at = log.find(kLossLine, at)) != std::string_view::npos;) {
    at += kLossLine.size();
    const std::string line(log.substr(at, log.find('\n', at) - at));
    std::istringstream words(line);
    std::string backend, reason;
    std::uint64_t count = 0;
    if (!(words >> backend >> reason >> count) || !concernsEvents(backend, reason)) continue;
    (isLate(reason) ? account.countedLate : account.counted) += count;
    account.reasons += (account.reasons.empty() ? "" : ", ") + line;
  }
}

void Ledger::clientReported(std::string_view output) {
  output = output.substr(0, output.rfind('\n') + 1);  // it may have been killed in the middle of a line
  std::istringstream words{std::string(output)};
  std::string word;
  std::int64_t first = 0, last = 0;
  std::uint64_t incarnation = 0;
  double seconds = 0;
  while (words >> word >> first >> last >> incarnation >> seconds) {
    auto& accepted = _accounts[incarnation].accepted;
    for (std::int64_t id = first; id <= last; ++id) accepted[id] = seconds;
  }
}

void Ledger::readEvents(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  file.seekg(_read);
  for (std::string line; std::getline(file, line) && !file.eof();) {  // the last line is still being written
    _read += static_cast<std::streamoff>(line.size() + 1);
    readEvent(line);
  }
}

void Ledger::readEvent(const std::string& line) {
  const auto parsed = boost::json::parse(line);
  const auto& event = parsed.at("event").as_object();
  const auto* id = event.if_contains(OracleMessage::kIDKey);
  if (id == nullptr) return;  // one of a session's own messages
  const std::string change =
      id->is_int64() ? OracleMessage(id->as_int64()).changeIn(event) : OracleMessage::kIDKey;
  if (!change.empty()) return _changed.push_back(change + " in " + boost::json::serialize(event));
  if (!_arrived.insert(id->as_int64()).second) ++_again;
}

std::vector<std::int64_t> Ledger::missing(const Account& account) const {
  std::vector<std::int64_t> missing;
  for (const auto& [id, seconds] : account.accepted) {
    if (!_arrived.contains(id)) missing.push_back(id);
  }
  return missing;
}

std::size_t Ledger::uncovered(const Account& account) const {
  if (account.end == DaemonEnd::Killed && _kills == Kills::MayLose) return 0;
  const bool mayLoseRecent = account.end == DaemonEnd::Killed && _kills == Kills::LoseRecent;
  const auto missing = this->missing(account);
  const auto lost = static_cast<std::size_t>(std::count_if(missing.begin(), missing.end(), [&](auto id) {
    return !mayLoseRecent || account.accepted.at(id) + kRecent < account.ended;
  }));
  return lost > account.counted ? lost - account.counted : 0;
}

bool Ledger::isCovered() const {
  std::size_t lost = 0;
  std::size_t lostLate = 0;
  for (const auto& [incarnation, account] : _accounts) {
    lost += uncovered(account);
    lostLate += account.countedLate;
  }
  return lost <= lostLate;
}

void Ledger::print(std::uint64_t incarnation, const Account& account) const {
  const auto missing = this->missing(account);
  std::printf("oracle: daemon %" PRIu64 ": %s, accepted %zu, missing %zu, counted %" PRIu64 " and %" PRIu64
              " late%s%s\n",
              incarnation, account.end == DaemonEnd::Killed ? "killed" : "terminated",
              account.accepted.size(), missing.size(), account.counted, account.countedLate,
              account.reasons.empty() ? "" : ": ", account.reasons.c_str());
  if (uncovered(account) == 0) return;
  std::printf("oracle: daemon %" PRIu64 " accepted message %" PRId64
              ", which neither arrived nor was counted by it\n",
              incarnation, *std::min_element(missing.begin(), missing.end()));
}

bool Ledger::judge() const {
  bool isGood = _changed.empty();
  std::size_t accepted = 0;
  std::size_t afterwards = 0;
  for (const auto& [incarnation, account] : _accounts) {
    print(incarnation, account);
    accepted += account.accepted.size();
    if (incarnation != _accounts.begin()->first) afterwards += account.accepted.size();
  }
  if (!isCovered()) {
    std::printf("oracle: LOST: not all that is missing was counted\n");
    isGood = false;
  }
  // The last daemon may start too late for any client to reach it.
  if (accepted == 0 || (_accounts.size() > 2 && afterwards == 0)) {
    std::printf("oracle: NOTHING was accepted%s\n", accepted == 0 ? "" : " after the first daemon's end");
    isGood = false;
  }
  std::printf("oracle: %zu messages arrived, %" PRIu64 " of them more than once, %zu changed\n",
              _arrived.size(), _again, _changed.size());
  if (!_changed.empty()) std::printf("oracle: CHANGED: %s\n", _changed.front().c_str());
  return isGood;
}

}  // namespace vesk::test
