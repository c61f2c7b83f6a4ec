#include "daemon/Operations.h"

#include <thread>

#include "common/PersistentIdentifiers.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// A session's end may wait for an upload or an adaptor; it goes on without the operator.
constexpr std::chrono::seconds kEndPatience{5};

Dictionary problem(const char* text) { return Dictionary{{"problem", text}}; }

constexpr char kNoOutbox[] = "the outbox is turned off (preference \"outbox\")";

Dictionary described(const WaitingPost& post) {
  MutableDictionary headers;
  for (const auto& [name, value] : post.request.headers) headers.set(name, value);
  const std::chrono::duration<double> kept = post.kept.time_since_epoch();
  return Dictionary{{"number", post.id},
                    {"url", post.request.url},
                    {"backend", post.request.source},
                    {"events", static_cast<std::int64_t>(post.request.events)},
                    {"time", kept.count()},
                    {"headers", headers.share()},
                    {"body", Bytes(post.request.body)}};
}

std::uint64_t withdrawnEvents(const Counters& counters) {
  std::uint64_t events = 0;
  for (const auto& [backend, reason, count] : counters.snapshot())
    events += reason == DropReason::ConsentWithdrawn ? count : 0;
  return events;
}

}  // namespace

Dictionary Operations::reload() {
  VESK_LOG_INFO("main: An operator asks for a new start.");
  _sources.reload();
  return {};
}

Dictionary Operations::holdOutbox(const Dictionary& request) {
  if (!_sources.outbox) return problem(kNoOutbox);
  const auto done = _sources.outbox->setHeld(booleanForKey(request, "held").value_or(false));
  return done ? Dictionary() : problem(done.error().text.c_str());
}

Dictionary Operations::readOutbox(const Dictionary& request) {
  if (!_sources.outbox) return problem(kNoOutbox);
  const auto host = request.text("host");
  if (!host) return problem("the request has no host");
  std::vector<Value> posts;
  for (const auto& post : _sources.outbox->waiting(host->view(), integerForKey(request, "after").value_or(0)))
    posts.emplace_back(described(post));
  return Dictionary{{"posts", List(std::move(posts))}};
}

Dictionary Operations::removeFromOutbox(const Dictionary& request) {
  if (!_sources.outbox) return problem(kNoOutbox);
  const auto host = request.text("host");
  const auto last = integerForKey(request, "last");
  if (!host || !last) return problem("the request has no host or no last");
  _sources.outbox->removeExported(host->view(), *last);
  return {};
}

Dictionary Operations::applyConsent() {
  const auto& services = _sources.services;
  const std::uint64_t before = withdrawnEvents(services.counters);
  const bool consent = services.diagnosticsSubmissionConsent();  // without it, the outbox begins to delete
  *services.consentWithdrawn = !consent;
  if (!consent) {
    if (_sources.outbox) _sources.outbox->withdrawConsent();
    renewPersistentIdentifiers();
  }
  const std::size_t sessions = endSessions();
  return Dictionary{
      {"consent", consent}, {"deleted", withdrawnEvents(services.counters) - before}, {"sessions", sessions}};
}

std::size_t Operations::endSessions() {
  std::vector<std::weak_ptr<ReportingdSession>> ending;
  for (const auto& session : _sources.agent.sessions()) {
    if (!session->sessionInfo()) continue;  // such as the operator's own connection
    session->end();
    ending.push_back(session);
  }
  const auto deadline = std::chrono::steady_clock::now() + kEndPatience;
  for (const auto& session : ending) {
    while (!session.expired() && std::chrono::steady_clock::now() < deadline)
      std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  return ending.size();
}

}  // namespace vesk
