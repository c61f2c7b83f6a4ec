#include "platform/outbox/PostOutbox.h"

#include <unistd.h>

#include <cerrno>
#include <future>
#include <utility>

#include "platform/files/PrivateFile.h"

namespace vesk {

namespace {

std::string holdFile(const std::string& path) { return path + ".hold"; }

}  // namespace

PostOutbox::PostOutbox(Options options)
    : _options(std::move(options)),
      _isHeld(::access(holdFile(_options.path).c_str(), F_OK) == 0),
      _storage(_options.path, {_options.maximumBytes, _options.maximumBytesInMemory}),
      _random(std::random_device{}()) {
  _lastID = _storage.lastID();
  const auto now = std::chrono::steady_clock::now();
  for (const auto& [host, posts] : _storage.countByHost()) _hosts[host].backoff.resume(now, random());
  _isWaiting = !_storage.isEmpty();
  publish();
}

PostOutbox::~PostOutbox() {
  stopSending();
  stop();
}

void PostOutbox::start(HTTPClient& client) {
  {
    MutexLock lock(_clientMutex);
    _client = &client;
  }
  if (!_isWaiting) return;
  _options.onWaiting(true);
  MutexLock lock(_mutex);
  _thread = std::thread([this] { run(); });
}

void PostOutbox::stopSending() {
  MutexLock lock(_clientMutex);
  _client = nullptr;
}

void PostOutbox::stop() {
  std::thread thread;
  {
    MutexLock lock(_mutex);
    if (std::exchange(_isStopped, true)) return;
    thread = std::move(_thread);
  }
  _wakeup.signal();
  if (thread.joinable()) thread.join();
}

void PostOutbox::setConsent(bool consent) {
  Losses deleted;
  {
    MutexLock lock(_mutex);
    if (_isClosedToConsent == !consent) return;
    _isClosedToConsent = !consent;
    if (consent || !_isWaiting) return;
    deleted = removeRespectingConsent(_inbox.changes.added);
    _inbox.consentWithdrawn = true;
  }
  report(Outcome::ConsentWithdrawn, deleted);
  _wakeup.signal();
}

bool PostOutbox::keep(HTTPRequest post, std::chrono::seconds delay) {
  return put(std::move(post), delay, false) != 0;
}

PostOutbox::Ticket PostOutbox::keepCopy(const HTTPRequest& post) {
  return put(post, std::chrono::seconds(0), true);
}

void PostOutbox::sendLater(Ticket ticket, std::chrono::seconds delay) {
  const auto id = static_cast<std::int64_t>(ticket);
  {
    MutexLock lock(_mutex);
    _beingSent.erase(id);
    if (delay > delay.zero()) _inbox.changes.postponed.emplace_back(id, after(delay));
  }
  _wakeup.signal();
}

void PostOutbox::discard(Ticket ticket) {
  {
    MutexLock lock(_mutex);
    _inbox.changes.removed.push_back(static_cast<std::int64_t>(ticket));
  }
  _wakeup.signal();
}

void PostOutbox::waitUntilWritten(Ticket ticket) {
  if (ticket <= _writtenUpTo) return;
  MutexLock lock(_mutex);
  while (ticket > _writtenUpTo) _written.wait(_mutex);
}

void PostOutbox::hostAnswered(std::string_view host) {
  if (!_isWaiting) return;
  {
    MutexLock lock(_mutex);
    if (_inbox.hosts.find(host) != _inbox.hosts.end()) return;
    _inbox.hosts.emplace(host);
  }
  _wakeup.signal();
}

PostOutbox::Ticket PostOutbox::put(HTTPRequest post, std::chrono::seconds delay, bool isBeingSent) {
  std::int64_t id = 0;
  {
    MutexLock lock(_mutex);
    if (_isStopped) return 0;
    id = ++_lastID;
    if (post.respectsConsent && _isClosedToConsent) {
      // A copy is not lost yet: its attempt goes on.
      if (isBeingSent) return 0;
      _options.onFate({Outcome::ConsentWithdrawn, post.source, post.events});
      return static_cast<Ticket>(id);
    }
    if (isBeingSent) _beingSent.insert(id);
    _inbox.changes.added.push_back({id, std::move(post), _options.clock->now(), after(delay)});
    _isWaiting = true;
    if (!_thread.joinable()) _thread = std::thread([this] { run(); });
  }
  _wakeup.signal();
  return static_cast<Ticket>(id);
}

// --- For operators

PostOutbox::Status PostOutbox::status() {
  MutexLock lock(_mutex);
  Status status = _status;
  status.maximumBytes = _options.maximumBytes;
  status.isHeld = _isHeld;
  return status;
}

void PostOutbox::runOnThread(const std::function<void()>& task) {
  std::promise<void> ended;
  {
    MutexLock lock(_mutex);
    if (_isStopped || !_thread.joinable()) return;
    _inbox.tasks.emplace_back([&task, &ended] {
      task();
      ended.set_value();
    });
  }
  _wakeup.signal();
  ended.get_future().wait();
}

Result<void> PostOutbox::setHeld(bool held) {
  const std::string file = holdFile(_options.path);
  if (held) {
    const auto made = makePrivateFile(file);
    if (!made && made.error().kind != Error::Kind::Exists) return made.error();
  } else if (::unlink(file.c_str()) != 0 && errno != ENOENT) {
    return systemError(errno, file);
  }
  _isHeld = held;
  runOnThread([this] {
    for (auto& [name, host] : _hosts) readAgainFromTheOldest(host);
  });
  return {};
}

void PostOutbox::withdrawConsent() {
  setConsent(false);
  runOnThread([this] { write(); });
}

std::vector<WaitingPost> PostOutbox::waiting(std::string_view host, std::int64_t id) {
  std::vector<WaitingPost> posts;
  runOnThread([&] { posts = readWaiting(host, id); });
  return posts;
}

void PostOutbox::removeExported(std::string_view host, std::int64_t last) {
  runOnThread([&] {
    for (const auto& post : readWaiting(host, 0)) {
      if (post.id > last) continue;
      _changes.removed.push_back(post.id);
      _options.onFate({Outcome::Exported, post.request.source, post.request.events});
    }
    write();
  });
}

}  // namespace vesk
