#include "tests/oracle/FaultRun.h"

#include <csignal>
#include <cstdio>
#include <stdexcept>
#include <thread>

#include "tests/oracle/OracleMessage.h"

namespace vesk::test {

namespace {

using namespace std::chrono_literals;

constexpr std::int64_t kIDsPerClient = 10'000'000;
constexpr int kKilled = 128 + SIGKILL;

constexpr char kStorebag[] = R"(
version = "2024.1"
refresh_cycle = 86400
[[release.httpPost.clients]]
client = "Oracle"
locale_whitelist = ["US"]
sampling_threshold = 1.0
post_url = "@EVENTS@"
realtime_post_url = "@EVENTS@/now"
[[release.httpPost.clients.filters]]
key = "no such key"
action = "remove"
)";

}  // namespace

FaultRun::FaultRun(Options options)
    : _options(options),
      _random(options.seed),
      _page((_harness.root / "page").string()),
      _isRefusing(!options.always && options.seed % 2 == 0),
      _ledger(options.always ? Ledger::Kills::LoseNothing
              : _isRefusing  ? Ledger::Kills::MayLose
                             : Ledger::Kills::LoseRecent) {
  _harness.writeStorebag("zelko", kStorebag);
  _harness.setPreference("keepStorebags", "true");
  if (_options.always) _harness.setPreference("outbox", "\"always\"");
  startDaemon();
  for (std::size_t i = 0; i < _options.clients; ++i) startClient(i);
}

void FaultRun::say(const std::string& what) const {
  const std::chrono::duration<double> since = std::chrono::steady_clock::now() - _begun;
  std::printf("oracle: %6.1f s  %s\n", since.count(), what.c_str());
  std::fflush(stdout);
}

void FaultRun::pause(std::uint64_t least, std::uint64_t most) {
  std::this_thread::sleep_for(std::chrono::milliseconds(least + _random() % (most - least + 1)));
}

// --- Faults

void FaultRun::disturb() {
  while (std::chrono::steady_clock::now() - _begun < std::chrono::seconds(_options.seconds)) {
    pause(_options.always ? 10 : 100, _options.always ? 400 : 1200);
    injectOne();
  }
}

void FaultRun::injectOne() {
  // Without server errors (5xx): they disable a backend, and everything after that is a counted drop.
  const auto drawn = _random() % 35;
  if (_options.always && drawn % 2 == 0) return replaceDaemon(DaemonEnd::Killed);
  if (drawn < 8) return answerBadly();
  if (drawn < 11) return stallPosts();
  if (drawn < 15) return collectorAway();
  if (drawn < 18) return freeze("collector", _harness.collector());
  if (drawn < 20) return freeze("client", *_clients[_random() % _clients.size()]);
  if (drawn < 26) return killClient();
  if (drawn < 31) return replaceDaemon(DaemonEnd::Terminated);
  if (drawn < 34) return replaceDaemon(DaemonEnd::Killed);
  reboot(_options.always ? DaemonEnd::Killed : DaemonEnd::Terminated);
}

void FaultRun::answerBadly() {
  static constexpr const char* kAnswers[] = {"reset", "close",      "garbage", "cut",
                                             "slow",  "empty-body", "404",     "302"};
  constexpr std::size_t kRefusals = 2;
  const auto answers = std::size(kAnswers) - (_isRefusing ? 0 : kRefusals);
  const std::string fault =
      "post=" + std::string(kAnswers[_random() % answers]) + "*" + std::to_string(upTo(4));
  say("collector: " + fault);
  _harness.setFault(fault);
}

// Unanswered posts occupy the daemon's connections. Only the collector's end frees them soon.
void FaultRun::stallPosts() {
  const std::string fault = "post=stall*" + std::to_string(upTo(8));
  say("collector: " + fault + ", then restarted");
  _harness.setFault(fault);
  pause(500, 2500);
  restartCollector();
}

void FaultRun::collectorAway() {
  say("collector away");
  _harness.stopCollector();
  pause(200, 4000);
  _harness.startCollector();
}

void FaultRun::freeze(const char* what, const ChildProcess& process) {
  say(std::string(what) + " frozen");
  process.signal(SIGSTOP);
  pause(200, 2000);
  process.signal(SIGCONT);
}

void FaultRun::killClient() {
  const auto index = static_cast<std::size_t>(_random() % _clients.size());
  say("client killed, another started");
  _clients[index]->signal(SIGKILL);
  if (!clientEnded(index, kKilled)) throw std::runtime_error("a client ended before it was killed");
  startClient(index);
}

void FaultRun::replaceDaemon(DaemonEnd end) {
  say(end == DaemonEnd::Killed ? "daemon killed, another started" : "daemon terminated, another started");
  endDaemon(end);
  startDaemon();
}

void FaultRun::reboot(DaemonEnd end) {
  say("no network, and the daemon replaced");
  _harness.stopCollector();
  pause(200, 1000);
  endDaemon(end);
  startDaemon();
  pause(200, 2000);
  _harness.startCollector();
}

// --- Processes

void FaultRun::startDaemon() {
  ++_page->incarnation;
  _harness.startDaemon({"--log-level", "6"});
  RoadClient first(_harness);
  if (!first.enabled) throw std::runtime_error("no storebag; daemon:\n" + _harness.daemon().errors());
}

void FaultRun::endDaemon(DaemonEnd end) {
  auto& daemon = _harness.daemon();
  daemon.signal(end == DaemonEnd::Killed ? SIGKILL : SIGTERM);
  const int status = daemon.wait().value_or(-1);
  if (status != (end == DaemonEnd::Killed ? kKilled : 0)) {
    throw std::runtime_error("the daemon ended with " + std::to_string(status) + ":\n" + daemon.errors());
  }
  _ledger.daemonEnded(_page->incarnation, end, daemon.errors());
}

void FaultRun::restartCollector() {
  _harness.stopCollector();
  _harness.startCollector();
}

void FaultRun::startClient(std::size_t index) {
  const auto firstID =
      kIDsPerClient * (static_cast<std::int64_t>(_options.seed % 10'000) * 1000 + ++_clientsStarted);
  _clients.resize(std::max(_clients.size(), index + 1));
  _clients[index] = std::make_unique<ChildProcess>(
      std::vector<std::string>{"/proc/self/exe", "--client", _harness.socketPath(),
                               (_harness.root / "page").string(), std::to_string(firstID)});
}

bool FaultRun::clientEnded(std::size_t index, int status) {
  auto& client = *_clients[index];
  const auto ended = client.wait();
  _ledger.clientReported(client.output());
  if (ended == status) return true;
  std::printf("%s\n", client.errors().c_str());
  return false;
}

// --- The end

bool FaultRun::judge() {
  say("no more faults");
  restartCollector();  // also removes the planned faults and the stalled posts
  _page->stop = true;
  for (std::size_t i = 0; i < _clients.size(); ++i) {
    if (!clientEnded(i, 0)) throw std::runtime_error("a client does not end as it should");
  }
  say("the clients have ended");
  sendFreshMessage();
  endDaemon(DaemonEnd::Terminated);
  say("the daemon has ended");
  startDaemon();
  sendFreshMessage();
  // Posts that the collector may have received wait in the outbox for half a minute.
  (void)eventually([&] {
    _ledger.readEvents((_harness.root / "events.jsonl").string());
    return _ledger.isCovered();
  });
  endDaemon(DaemonEnd::Terminated);
  return _ledger.judge();
}

void FaultRun::sendFreshMessage() {
  constexpr std::int64_t kFresh = 1;
  RoadClient client(_harness);
  if (!client.reporting.sendMessageAndWait(OracleMessage(kFresh).parameters(1), ChildProcess::kPatience))
    throw std::runtime_error("the daemon does not take a fresh message");
  const bool hasArrived = eventually([&] {
    _ledger.readEvents((_harness.root / "events.jsonl").string());
    return _ledger.hasArrived(kFresh);
  });
  if (!hasArrived) throw std::runtime_error("a fresh message does not flow");
  say("a fresh message flows");
}

}  // namespace vesk::test
