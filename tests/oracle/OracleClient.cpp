#include "tests/oracle/OracleClient.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>
#include <thread>

#include "tests/oracle/OracleMessage.h"

namespace vesk::test {

namespace {

using namespace std::chrono_literals;

constexpr auto kAnswerTime = 20s;

Dictionary sessionInfo(std::int64_t id, bool batches, bool requiresUserInfo) {
  return Dictionary{{kVeskReportingSessionInfoSessionID, static_cast<unsigned>(id)},
                    {kVeskReportingSessionInfoClientType, 5},
                    {kVeskReportingSessionInfoClientVersion, 3},
                    {kVeskReportingSessionInfoBatchEvent, batches},
                    {kVeskReportingSessionInfoRequireUserInfo, requiresUserInfo}};
}

const Dictionary kUser{{kVeskReportingUserInfoClientName, "Oracle"}};

}  // namespace

OracleClient::OracleClient(std::string socketPath, const std::string& pagePath, std::int64_t firstID)
    : _socketPath(std::move(socketPath)),
      _page(pagePath),
      _nextID(firstID),
      _random(static_cast<std::uint64_t>(firstID)) {}

int OracleClient::run() {
  while (!_page->stop) runSession();
  return 0;
}

void OracleClient::runSession() {
  ReportingOptions options;
  options.socketPath = _socketPath;
  options.lastReconnectWait = 500ms;
  VeskReporting session(options);
  if (!start(session)) return;
  bool goesOn = true;
  for (auto rounds = upTo(30); rounds > 0 && goesOn && !_page->stop; --rounds) {
    // Keeps most outages below the daemon's limits: without drops, the judgement is exact.
    std::this_thread::sleep_for(std::chrono::milliseconds(upTo(200)));
    const auto kind = _random() % 10;
    if (kind < 5) goesOn = sendOneWay(session, 0);
    if (kind == 5 || kind == 6) goesOn = sendOneWay(session, 1);
    if (kind > 6 && kind < 9) goesOn = sendAnswered(session);
    if (kind == 9) goesOn = sendOnce(session);
  }
}

bool OracleClient::start(VeskReporting& session) {
  const bool batches = _random() % 2 == 0;
  const bool requiresUserInfo = _random() % 3 == 0;
  auto status = session.setSessionInfo(sessionInfo(_nextID, batches, requiresUserInfo),
                                       requiresUserInfo ? std::optional(kUser) : std::nullopt);
  if (status != ReportingStatus::Queued) return false;
  auto started = session.startConfig(kAnswerTime);
  return started && started.answer;
}

bool OracleClient::sendOneWay(VeskReporting& session, int flag) {
  const auto incarnation = _page->incarnation.load();
  const auto first = _nextID;
  for (auto count = upTo(60); count > 0; --count) {
    if (session.sendMessage(OracleMessage(_nextID).parameters(flag)) != ReportingStatus::Queued) break;
    ++_nextID;
  }
  if (!session.flushMessagesAndWait(kAnswerTime)) return false;
  confirm(first, incarnation);
  return true;
}

bool OracleClient::sendAnswered(VeskReporting& session) {
  for (auto count = upTo(20); count > 0; --count) {
    const auto incarnation = _page->incarnation.load();
    const auto first = _nextID++;
    // Realtime, since a message that is held in a batch is not confirmed by its answer.
    if (!session.sendMessageAndWait(OracleMessage(first).parameters(1), kAnswerTime)) return false;
    confirm(first, incarnation);
  }
  return true;
}

bool OracleClient::sendOnce(VeskReporting& session) {
  const auto incarnation = _page->incarnation.load();
  const OracleMessage message(_nextID);
  const auto first = _nextID++;
  auto sent = session.sendMessageOnceAndWait(sessionInfo(first, false, false), kUser, message.category(),
                                             message.type(), message.payload(), kAnswerTime);
  if (sent && sent.answer == "finished") confirm(first, incarnation);
  return false;  // the session is a different one now
}

void OracleClient::confirm(std::int64_t first, std::uint64_t incarnation) {
  if (first == _nextID || _page->incarnation != incarnation) return;
  const std::chrono::duration<double> now = std::chrono::steady_clock::now().time_since_epoch();
  std::printf("accepted %lld %lld %llu %.3f\n", static_cast<long long>(first),
              static_cast<long long>(_nextID - 1), static_cast<unsigned long long>(incarnation), now.count());
  std::fflush(stdout);
}

}  // namespace vesk::test
