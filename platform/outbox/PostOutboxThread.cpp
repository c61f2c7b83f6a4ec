// The outbox's own thread: it writes what was kept and sends what waits.
#include <poll.h>
#include <pthread.h>
#include <signal.h>

#include <algorithm>
#include <iterator>
#include <limits>
#include <utility>

#include "platform/http/HTTPExchange.h"
#include "platform/log/SystemLog.h"
#include "platform/outbox/PostOutbox.h"
#include "platform/outbox/RetryAfter.h"

namespace vesk {

namespace {

// One for each connection, and one more, so that no connection waits for the next post. Few, since those that
// were handed over are sent even if the server refuses one because it is busy.
constexpr std::size_t kHandedOver = 3;
constexpr std::size_t kMostChangesAtOnce = 256;
constexpr std::chrono::seconds kReadAgainAfter{5};  // for posts that may not be sent yet
constexpr std::chrono::hours kExpiryInterval{1};

PostOutbox::Outcome outcomeOf(long status) {
  return status >= 200 && status <= 299 ? PostOutbox::Outcome::Delivered : PostOutbox::Outcome::Refused;
}

}  // namespace

std::vector<WaitingPost> PostOutbox::readWaiting(std::string_view host, std::int64_t id) {
  constexpr WallTime kAnyTime = WallTime::max() - std::chrono::hours(1);
  if (_changes.size() > 0) write();
  OutboxStorage::Lost lost;
  std::vector<WaitingPost> idle;
  auto posts = _storage.read(host, id, kAnyTime, lost);
  report(lost);
  MutexLock lock(_mutex);
  for (auto& post : posts) {
    if (!_beingSent.contains(post.id) && !_taken.contains(post.id)) idle.push_back(std::move(post));
  }
  return idle;
}

void PostOutbox::run() {
  sigset_t all;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, nullptr);
  pthread_setname_np(pthread_self(), "outbox");
  NetworkMonitor network;
  bool wasWaiting = !_storage.isEmpty();
  for (bool stopping = false; !stopping;) {
    waitForWork(network);
    Inbox inbox;
    Ticket taken = 0;
    {
      MutexLock lock(_mutex);
      std::swap(inbox, _inbox);
      taken = static_cast<Ticket>(_lastID);
      stopping = _isStopped;
    }
    const auto tasks = std::move(inbox.tasks);
    take(std::move(inbox));
    for (const auto& task : tasks) task();
    if (stopping) _storage.tryFileAgain();
    if (stopping || (_writeBy && *_writeBy <= std::chrono::steady_clock::now())) write();
    if (_changes.added.empty()) tellWritten(taken);
    if (stopping) break;
    expire();
    sendReady();
    publish();
    const bool isWaiting = !_storage.isEmpty() || _changes.size() > 0;
    if (isWaiting != wasWaiting) _options.onWaiting(isWaiting);
    if (wasWaiting && !isWaiting) {
      MutexLock lock(_mutex);
      _isWaiting = _inbox.changes.size() > 0;
    }
    wasWaiting = isWaiting;
  }
  report(Outcome::NotWritten, _storage.waitingInMemory());
}

void PostOutbox::publish() {
  Status status;
  for (const auto& [name, posts] : _storage.countByHost()) {
    const auto host = _hosts.find(name);
    status.hosts[name] = {posts, host == _hosts.end() ? Instant{} : host->second.backoff.next(),
                          host == _hosts.end() ? std::chrono::steady_clock::now() : host->second.since};
    status.posts += posts;
  }
  status.bytes = _storage.bytes();
  MutexLock lock(_mutex);
  _status = std::move(status);
}

void PostOutbox::tellWritten(Ticket upTo) {
  if (upTo == _writtenUpTo) return;
  {
    MutexLock lock(_mutex);
    _writtenUpTo = upTo;
  }
  _written.notify_all();
  MutexLock lock(_clientMutex);
  if (_client) _client->keptPostsWereWritten();
}

void PostOutbox::waitForWork(NetworkMonitor& network) {
  int timeout = -1;
  if (const auto next = nextEvent()) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*next - std::chrono::steady_clock::now());
    timeout = static_cast<int>(std::clamp<long long>(left.count(), 0, std::numeric_limits<int>::max()));
  }
  pollfd sources[] = {{_wakeup.fd(), POLLIN, 0}, {network.fd(), POLLIN, 0}};
  ::poll(sources, std::size(sources), timeout);
  _wakeup.clear();
  if ((sources[1].revents & POLLIN) == 0 || !network.takeChange()) return;
  for (auto& [name, host] : _hosts) host.backoff.networkChanged(std::chrono::steady_clock::now(), random());
}

std::optional<PostOutbox::Instant> PostOutbox::nextEvent() const {
  std::optional<Instant> next = _writeBy;
  const auto consider = [&next](Instant time) {
    if (!next || time < *next) next = time;
  };
  if (!_storage.isEmpty()) consider(_nextExpiry);
  for (const auto& [name, host] : _hosts) {
    // Otherwise the answers wake the thread.
    if (_mustSend && !_isHeld && host.sending == 0)
      consider(std::max(host.backoff.next(), host.ready.empty() ? host.readAgain : Instant{}));
  }
  return next;
}

void PostOutbox::take(Inbox inbox) {
  const auto now = std::chrono::steady_clock::now();
  if (inbox.consentWithdrawn) deletePostsThatRespectConsent();
  for (const auto& answer : inbox.answers) take(answer);
  for (auto& post : inbox.changes.added) {
    Host& host = _hosts[std::string(hostOfURL(post.request.url))];
    host.backoff.begin(now, random());
    host.readAgain = {};
    _changes.added.push_back(std::move(post));
  }
  auto& changes = inbox.changes;
  _changes.postponed.insert(_changes.postponed.end(), changes.postponed.begin(), changes.postponed.end());
  _changes.removed.insert(_changes.removed.end(), changes.removed.begin(), changes.removed.end());
  for (const auto& name : inbox.hosts) {
    auto host = _hosts.find(name);
    if (host != _hosts.end()) host->second.backoff.hostAnswered(now);
  }
  if (_changes.size() == 0) return;
  // What was removed waits until the file can be written again; what is new does not.
  const bool waitsForFile = _writeBy && *_writeBy > now + _options.writeWithin;
  if (waitsForFile && _changes.added.empty()) return;
  const Instant due = _changes.size() >= kMostChangesAtOnce ? now : now + _options.writeWithin;
  if (!_writeBy || due < *_writeBy) _writeBy = due;
}

void PostOutbox::take(const Answer& answer) {
  const auto now = std::chrono::steady_clock::now();
  Host& host = _hosts[answer.host];
  --host.sending;
  if (!answer.result.response) {
    const auto kind = answer.result.error->kind;
    // The server may be processing the post.
    if (kind == HTTPError::Kind::Interrupted || kind == HTTPError::Kind::Timeout) {
      _changes.postponed.emplace_back(answer.id, after(kWaitAfterWholeBody));
    }
    _taken.erase(answer.id);
    readAgainFromTheOldest(host);
    host.backoff.failed(now, random());
    return;
  }
  const long status = answer.result.response->status;
  if (answer.result.response->isBusyOrBroken()) {
    host.backoff.held(now, retryAfter(*answer.result.response, _options.clock->now()), random());
  } else {
    host.backoff.succeeded();
  }
  if (outcomeOf(status) == Outcome::Refused) {
    VESK_LOG_INFO("Outbox: %s refused %llu events that had waited (status %ld)", answer.host.c_str(),
                  static_cast<unsigned long long>(answer.post.events), status);
  }
  _changes.removed.push_back(answer.id);
  _options.onFate({outcomeOf(status), answer.post.source, answer.post.events, status});
}

void PostOutbox::write() {
  _writeBy.reset();
  OutboxStorage::Lost lost;
  // A post that was answered before its copy was written.
  std::sort(_changes.removed.begin(), _changes.removed.end());
  std::erase_if(_changes.added, [this](const WaitingPost& post) {
    return std::binary_search(_changes.removed.begin(), _changes.removed.end(), post.id);
  });
  const auto removed = _changes.removed;
  const std::size_t added = _changes.added.size();
  _storage.write(_changes, std::chrono::steady_clock::now(), lost);
  if (_changes.removed.empty()) {
    MutexLock lock(_mutex);
    for (std::int64_t id : removed) {
      _taken.erase(id);
      _beingSent.erase(id);
    }
  } else {
    _writeBy = std::chrono::steady_clock::now() + std::chrono::seconds(60);  // the file can't be written now
  }
  if (added > 0) {
    VESK_LOG_DEBUG("Outbox: %zu posts are put aside", added);
    for (auto& [name, host] : _hosts) host.readAgain = {};
  }
  if (_storage.isEmpty()) _storage.shrinkIfEmpty(lost);
  report(lost);
}

void PostOutbox::expire() {
  const auto now = std::chrono::steady_clock::now();
  if (now < _nextExpiry) return;
  _nextExpiry = now + kExpiryInterval;
  OutboxStorage::Lost lost;
  const WallTime time = _options.clock->now();
  report(Outcome::Expired, _storage.removeKeptBefore(time - _options.maximumAge, time, lost));
  report(lost);
}

PostOutbox::Losses PostOutbox::removeRespectingConsent(std::vector<WaitingPost>& posts) {
  Losses removed;
  std::erase_if(posts, [&removed](const WaitingPost& post) {
    if (!post.request.respectsConsent) return false;
    removed.push_back({post.request.source, post.request.events});
    return true;
  });
  return removed;
}

void PostOutbox::deletePostsThatRespectConsent() {
  Losses deleted = removeRespectingConsent(_changes.added);
  for (auto& [name, host] : _hosts) readAgainFromTheOldest(host);
  OutboxStorage::Lost lost;
  for (auto& each : _storage.removeRespectingConsent(lost)) deleted.push_back(std::move(each));
  report(Outcome::ConsentWithdrawn, deleted);
  report(lost);
}

void PostOutbox::readAgainFromTheOldest(Host& host) {
  for (const auto& post : host.ready) _taken.erase(post.id);
  host.ready.clear();
  host.lastRead = 0;
}

// --- Sending

// False if all that is kept are copies of posts that the client sends itself.
bool PostOutbox::hasPostsToSend() {
  MutexLock lock(_mutex);
  return _storage.count() + _changes.added.size() > _beingSent.size();
}

void PostOutbox::sendReady() {
  _mustSend = hasPostsToSend();
  for (auto each = _hosts.begin(); each != _hosts.end();) {
    auto& [name, host] = *each;
    if (_mustSend && !_isHeld) sendReady(name, host);
    const bool isDone =
        host.sending == 0 && host.ready.empty() && _changes.added.empty() && !_storage.has(name);
    each = isDone ? _hosts.erase(each) : std::next(each);
  }
}

void PostOutbox::sendReady(const std::string& name, Host& host) {
  if (host.backoff.next() > std::chrono::steady_clock::now()) return;
  // One post finds out whether the host is back.
  const std::size_t most = host.backoff.isUp() ? kHandedOver : 1;
  while (host.sending < most) {
    if (host.ready.empty()) readMore(name, host);
    if (host.ready.empty()) return;
    send(name, host);
  }
}

void PostOutbox::readMore(const std::string& name, Host& host) {
  const auto now = std::chrono::steady_clock::now();
  if (now < host.readAgain) return;
  OutboxStorage::Lost lost;
  auto posts = _storage.read(name, host.lastRead, _options.clock->now(), lost);
  report(lost);
  if (posts.empty()) {
    host.readAgain = now + kReadAgainAfter;
    host.lastRead = 0;
    return;
  }
  host.lastRead = posts.back().id;
  MutexLock lock(_mutex);
  for (auto& post : posts) {
    if (_beingSent.contains(post.id) || !_taken.insert(post.id).second) continue;
    host.ready.push_back(std::move(post));
  }
}

void PostOutbox::send(const std::string& name, Host& host) {
  WaitingPost post = std::move(host.ready.front());
  host.ready.pop_front();
  post.request.retry = HTTPRequest::Retry::Never;
  post.request.isBackground = true;
  auto answer =
      std::make_shared<Answer>(Answer{post.id, name, {post.request.source, post.request.events}, {}});
  auto completion = [this, answer](HTTPResult result) {
    answer->result = std::move(result);
    {
      MutexLock lock(_mutex);
      _inbox.answers.push_back(std::move(*answer));
    }
    _wakeup.signal();
  };
  ++host.sending;
  MutexLock lock(_clientMutex);
  if (_client) {
    _client->start(std::move(post.request), std::move(completion));
  } else {
    completion({std::nullopt, HTTPError{HTTPError::Kind::Stopped, "sending was stopped"}});
  }
}

// --- Reports

void PostOutbox::report(Outcome outcome, const Losses& lost) const {
  for (const auto& each : lost) _options.onFate({outcome, each.source, each.events});
}

void PostOutbox::report(const OutboxStorage::Lost& lost) const {
  report(Outcome::OverQuota, lost.overQuota);
  report(Outcome::Damaged, lost.damaged);
}

}  // namespace vesk
