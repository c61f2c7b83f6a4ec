#include "tools/veskreport/MessageFate.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <chrono>

#include "protocol/WireNames.h"

namespace vesk {

namespace {

bool isPosted(const Dictionary& record) { return textIn(record, "outcome") == "posted"; }

/// Whether a post or datagram carries the message.
bool carries(const Dictionary& record, std::int64_t eventID) {
  if (const auto only = integerForKey(record, "eventID")) return *only == eventID;
  const auto last = integerForKey(record, "upToEventID");
  return last && eventID <= *last;
}

std::string causeIn(const Dictionary& record) {
  const auto because = textIn(record, "because");
  return because.empty() ? textIn(record, "reason") : because;
}

std::string wordsFor(const Dictionary& record) {
  const auto outcome = textIn(record, "outcome");
  if (outcome == "held") return "held until a flush";
  if (outcome == "posted") return "not answered yet";
  return outcome == "delivered" ? "sent" : outcome;
}

}  // namespace

MessageWatch::MessageWatch(const Invocation& invocation, const Output& output, const Dictionary& sessionInfo,
                           const char* outcome, bool waits)
    : _invocation(invocation),
      _sessionID(integerForKey(sessionInfo, kVeskReportingSessionInfoSessionID).value_or(0)),
      _daemon(invocation, output) {
  MutableDictionary filter(Dictionary{{"sessionID", _sessionID}, {"messages", true}}, 1);
  if (*outcome != '\0') filter.set("outcome", outcome);
  if (!waits) filter.set("wait", false);
  const auto opened = _daemon.call(wire::kOpenTap, {filter.share()});
  _isOpen = opened && opened->empty();
}

std::vector<Dictionary> MessageWatch::next(std::uint64_t& lost) {
  const auto batch = _daemon.call(wire::kReadTap);
  if (!batch) return {};
  lost += static_cast<std::uint64_t>(integerForKey(*batch, "lost").value_or(0));
  return listIn(*batch, "records");
}

MessageWatch::Drops MessageWatch::drops() {
  Drops drops;
  if (!_isOpen) return drops;
  for (auto records = next(drops.count); !records.empty(); records = next(drops.count)) {
    for (const auto& record : records) {
      if (integerForKey(record, "category") == 0) continue;  // the session's own start or end
      drops.count += static_cast<std::uint64_t>(integerForKey(record, "count").value_or(1));
      if (drops.cause.empty()) drops.cause = textIn(record, "backend") + ": " + causeIn(record);
    }
  }
  return drops;
}

std::vector<MessageWatch::Fate> MessageWatch::fates(std::uint16_t category, std::uint16_t type) {
  if (!_isOpen) return {};
  const auto deadline = std::chrono::steady_clock::now() + _invocation.timeout;
  std::uint64_t lost = 0;
  do {
    const auto records = next(lost);
    for (const auto& record : records) take(record, category, type);
    if (records.empty() && !isWaiting()) break;
  } while (isWaiting() && std::chrono::steady_clock::now() < deadline);

  std::vector<Fate> all;
  std::string version;
  for (const auto& message : _messages) {
    all.push_back(message.fate);
    if (message.fate.outcome != "dropped" || message.fate.backend == "session") continue;
    if (version.empty()) version = storebagVersion();
    if (!version.empty()) all.back().cause += " (storebag " + version + ")";
  }
  return all;
}

void MessageWatch::take(const Dictionary& record, std::uint16_t category, std::uint16_t type) {
  const auto backend = textIn(record, "backend");
  if (textIn(record, "what") == "message") {
    const auto found = integerForKey(record, "category");
    if (found && (*found != category || integerForKey(record, "type") != type)) return;
    std::erase_if(_messages, [&](const auto& message) { return message.fate.backend == backend; });
    _messages.push_back({{backend, wordsFor(record), causeIn(record)},
                         integerForKey(record, "eventID").value_or(0),
                         !isPosted(record)});
    return;
  }
  for (auto& message : _messages) {
    if (message.fate.backend != backend || !carries(record, message.eventID)) continue;
    message.fate.outcome = wordsFor(record);
    message.fate.cause = causeIn(record);
    message.isDone = true;
  }
}

bool MessageWatch::isWaiting() const {
  return std::ranges::any_of(_messages, [](const auto& message) { return !message.isDone; });
}

std::string MessageWatch::storebagVersion() {
  const auto status = _daemon.call(wire::kGetStatus);
  for (const auto& session : listIn(status ? *status : Dictionary(), "sessions")) {
    if (integerForKey(session, "sessionID") == _sessionID.asInteger())
      return textIn(session, "storebagVersion");
  }
  return "";
}

int reportFates(const std::vector<MessageWatch::Fate>& fates, const std::optional<std::string>& answer,
                const Output& output) {
  std::vector<std::string> lines;
  MutableDictionary backends;
  std::string dropped;
  bool isLost = !fates.empty();
  if (answer) lines.push_back(*answer);
  if (fates.empty() && !answer) lines.emplace_back("accepted");
  for (const auto& fate : fates) {
    const std::string cause = fate.cause.empty() ? "" : ": " + fate.cause;
    lines.push_back(fate.backend + ": " + fate.outcome + cause);
    backends.set(fate.backend, Dictionary{{"outcome", fate.outcome}, {"cause", fate.cause}});
    if (fate.outcome != "dropped") {
      isLost = false;
    } else if (dropped.empty()) {
      dropped = "dropped: " + fate.backend + cause;
    }
  }
  const Dictionary fields{{"answer", answer ? Value(*answer) : Value()}, {"backends", backends.share()}};
  return isLost ? output.failed(dropped, fields) : output.done(lines, fields);
}

}  // namespace vesk
