#include "platform/http/HTTPSchedule.h"

#include <algorithm>
#include <new>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {
constexpr std::chrono::seconds kLongestWait{10};
constexpr char kTooMany[] = "too many posts wait to be sent";

/// Whether other posts to the same host would fail in the same way.
bool isOfTheHost(const HTTPError& error) {
  using Kind = HTTPError::Kind;
  return error.kind != Kind::BadURL && error.kind != Kind::OutOfMemory;
}
}  // namespace

HTTPSchedule::HTTPSchedule(const HTTPClient::Options& options)
    : _policy{options.retryFor, options.firstRetryAfter, kLongestWait},
      _maximumWaiting(options.maximumWaiting),
      _maximumMemory(options.maximumMemory),
      _maximumActive(std::max<std::size_t>(options.maximumConnectionsPerHost, 1)),
      _maximumActivePosts(std::max<std::size_t>(_maximumActive - 1, 1)),
      _random(std::random_device{}()) {}

void HTTPSchedule::add(Exchange exchange) noexcept {
  Host* host = hostFor(*exchange);
  if (!host) {
    exchange->fail(outOfMemory());
    return;
  }
  if (!exchange->isPost()) {
    host->requests.pushBack(std::move(exchange));
    return;
  }
  Lane& lane = laneOf(*host, *exchange);
  // If no other attempt will show whether the host is back, this post does not wait.
  const bool mustWait = host->outage && host->activePosts + host->queuedPosts > 0;
  if (mustWait && !makeRoom(waitingBodies, *host, lane, exchange->bodySize(), _maximumWaiting)) {
    exchange->fail(httpError(host->outage->kind, host->outage->description));
  } else if (!makeRoom(memory, *host, lane, exchange->cost(), _maximumMemory)) {
    exchange->fail(httpError(HTTPError::Kind::Other, kTooMany));
  } else {
    lane.bodies += exchange->bodySize();
    lane.cost += exchange->cost();
    lane.posts.pushBack(std::move(exchange));
    ++host->queuedPosts;
  }
}

void HTTPSchedule::advance(Instant now) noexcept {
  while (!_retries.empty() && _retries.begin()->first <= now) {
    Host& host = hostOf(*_retries.begin()->second);
    queueFirst(host, std::move(_retries.extract(_retries.begin()).mapped()));
  }
  for (auto& [name, host] : _hosts) {
    HTTPQueue inTime;
    while (auto request = host.requests.pop()) {
      if (request->deadline() > now) {
        inTime.pushBack(std::move(request));
      } else {
        request->fail(httpError(HTTPError::Kind::Timeout, "timed out before a connection was free"));
      }
    }
    host.requests.swap(inTime);
  }
  std::erase_if(_hosts, isUnused);
}

HTTPSchedule::Exchange HTTPSchedule::next(Instant now) noexcept {
  for (auto& [name, host] : _hosts) {
    if (host.active >= _maximumActive) continue;
    Exchange exchange = host.requests.pop();
    if (!exchange && host.activePosts < _maximumActivePosts && (exchange = takePost(host))) {
      ++host.activePosts;
    }
    if (!exchange) continue;
    ++host.active;
    if (exchange->attempts++ == 0) exchange->firstAttempt = now;
    return exchange;
  }
  return nullptr;
}

void HTTPSchedule::answered(const HTTPExchange& exchange) noexcept {
  Host& host = hostOf(exchange);
  release(host, exchange);
  if (!host.outage) return;
  VESK_LOG_INFO("HTTPClient: %.*s answers again", static_cast<int>(exchange.host().size()),
                exchange.host().data());
  host.outage.reset();
  bringBack(host);
}

void HTTPSchedule::failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now) noexcept {
  Host& host = hostOf(*exchange);
  release(host, *exchange);
  if (exchange->isPost() && isOfTheHost(error)) beginOutage(host, *exchange, error, now);
  if (mayRetry && exchange->isPost() && keepForRetry(host, exchange, now)) return;
  exchange->fail(std::move(error));
}

void HTTPSchedule::stopAllButPosts() noexcept {
  for (auto& [name, host] : _hosts) {
    while (auto request = host.requests.pop()) request->fail(stopped());
  }
}

void HTTPSchedule::retryNow() noexcept {
  for (auto& [name, host] : _hosts) bringBack(host);
}

void HTTPSchedule::stopAll() noexcept {
  stopAllButPosts();
  for (auto& [name, host] : _hosts) {
    while (auto post = takePost(host)) post->fail(stopped());
  }
  for (auto& [time, post] : _retries) post->fail(stopped());
  _hosts.clear();
  _retries.clear();
}

std::optional<HTTPSchedule::Instant> HTTPSchedule::nextAdvance() const noexcept {
  std::optional<Instant> next;
  auto consider = [&next](Instant time) {
    if (!next || time < *next) next = time;
  };
  if (!_retries.empty()) consider(_retries.begin()->first);
  for (const auto& [name, host] : _hosts) {
    const HTTPExchange* request = host.requests.front();
    for (; request; request = request->next.get()) consider(request->deadline());
  }
  return next;
}

std::size_t HTTPSchedule::memory(const Host&, const Lane& lane) noexcept { return lane.cost; }

std::size_t HTTPSchedule::waitingBodies(const Host& host, const Lane& lane) noexcept {
  return host.outage ? lane.bodies : 0;
}

bool HTTPSchedule::isUnused(const Hosts::value_type& entry) noexcept {
  const Host& host = entry.second;
  return host.active == 0 && host.requests.empty() &&
         std::all_of(host.lanes.begin(), host.lanes.end(),
                     [](const auto& lane) { return lane.second.cost == 0; });
}

HTTPSchedule::Host* HTTPSchedule::hostFor(const HTTPExchange& exchange) noexcept try {
  auto found = _hosts.find(exchange.host());
  if (found == _hosts.end()) found = _hosts.try_emplace(std::string(exchange.host())).first;
  if (exchange.isPost()) found->second.lanes.try_emplace(exchange.request.owner);
  return &found->second;
} catch (const std::bad_alloc&) {
  return nullptr;
}

HTTPSchedule::Host& HTTPSchedule::hostOf(const HTTPExchange& exchange) noexcept {
  return _hosts.find(exchange.host())->second;
}

HTTPSchedule::Lane& HTTPSchedule::laneOf(Host& host, const HTTPExchange& exchange) noexcept {
  return host.lanes.find(exchange.request.owner)->second;
}

void HTTPSchedule::queueFirst(Host& host, Exchange post) noexcept {
  Lane& lane = laneOf(host, *post);
  lane.posts.pushFront(std::move(post));
  ++host.queuedPosts;
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host) noexcept {
  auto lane = host.lanes.upper_bound(host.lastServed);
  for (std::size_t i = 0; i < host.lanes.size(); ++i, ++lane) {
    if (lane == host.lanes.end()) lane = host.lanes.begin();
    if (lane->second.posts.empty()) continue;
    host.lastServed = lane->first;
    return takePost(host, lane->second);
  }
  return nullptr;
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host, Lane& lane) noexcept {
  Exchange post = lane.posts.pop();
  if (!post) return nullptr;
  --host.queuedPosts;
  lane.bodies -= post->bodySize();
  lane.cost -= post->cost();
  return post;
}

// Waits are spread to spare servers with many devices. One device's posts resume immediately, oldest first.
void HTTPSchedule::bringBack(Host& host) noexcept {
  Retries back;
  for (auto each = _retries.begin(); each != _retries.end();) {
    auto retry = each++;
    if (&hostOf(*retry->second) != &host) continue;
    auto node = _retries.extract(retry);
    node.key() = node.mapped()->started;
    back.insert(std::move(node));
  }
  while (!back.empty()) queueFirst(host, std::move(back.extract(std::prev(back.end())).mapped()));
}

bool HTTPSchedule::makeRoom(Measure measure, const Host& host, const Lane& lane, std::size_t size,
                            std::size_t bound) noexcept {
  for (;;) {
    std::size_t all = 0;
    std::size_t most = 0;
    Host* hostOfFullest = nullptr;
    Lane* fullest = nullptr;
    for (auto& [name, each] : _hosts) {
      for (auto& [owner, other] : each.lanes) {
        const std::size_t held = measure(each, other);
        all += held;
        if (held <= most) continue;
        most = held;
        hostOfFullest = &each;
        fullest = &other;
      }
    }
    if (all + size <= bound) return true;
    if (!fullest || measure(host, lane) + size > most) return false;
    dropOne(*hostOfFullest, *fullest);
  }
}

void HTTPSchedule::dropOne(Host& host, Lane& lane) noexcept {
  Exchange dropped = takePost(host, lane);
  for (auto each = _retries.begin(); !dropped; ++each) {
    if (&laneOf(hostOf(*each->second), *each->second) != &lane) continue;
    dropped = std::move(_retries.extract(each).mapped());
    lane.bodies -= dropped->bodySize();
    lane.cost -= dropped->cost();
    break;
  }
  dropped->fail(host.outage ? httpError(host.outage->kind, host.outage->description)
                            : httpError(HTTPError::Kind::Other, kTooMany));
}

void HTTPSchedule::release(Host& host, const HTTPExchange& exchange) noexcept {
  --host.active;
  if (exchange.isPost()) --host.activePosts;
}

void HTTPSchedule::beginOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error,
                               Instant now) noexcept {
  if (!host.outage) {
    VESK_LOG_INFO("HTTPClient: no answer from %.*s: %s", static_cast<int>(exchange.host().size()),
                  exchange.host().data(), error.description.c_str());
  }
  host.outage = httpError(error.kind, error.description);
  if (exchange.firstAttempt + _policy.retryFor > now) return;
  // A few attempts fill the slots of a host that swallows connections; posts behind them would wait for ever.
  for (auto& [owner, lane] : host.lanes) {
    while (!lane.posts.empty() && lane.posts.front()->started + _policy.retryFor <= now) {
      takePost(host, lane)->fail(httpError(error.kind, error.description));
    }
  }
}

bool HTTPSchedule::keepForRetry(Host& host, Exchange& exchange, Instant now) noexcept try {
  const double random = std::uniform_real_distribution<double>()(_random);
  auto wait = _policy.waitAfter(exchange->attempts, exchange->firstAttempt, now, random);
  Lane& lane = laneOf(host, *exchange);
  if (!wait || !makeRoom(waitingBodies, host, lane, exchange->bodySize(), _maximumWaiting) ||
      !makeRoom(memory, host, lane, exchange->cost(), _maximumMemory)) {
    return false;
  }
  Exchange& kept = _retries.emplace(now + *wait, nullptr)->second;
  lane.bodies += exchange->bodySize();
  lane.cost += exchange->cost();
  kept = std::move(exchange);
  return true;
} catch (const std::bad_alloc&) {
  return false;
}

}  // namespace vesk
