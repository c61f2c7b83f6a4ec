#include "platform/http/HTTPSchedule.h"

#include <algorithm>
#include <new>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {
constexpr std::chrono::seconds kLongestWait{10};

/// Whether a post to the same host would fail likewise.
bool isOfTheHost(const HTTPError& error) {
  using Kind = HTTPError::Kind;
  return error.kind != Kind::BadURL && error.kind != Kind::OutOfMemory;
}
}  // namespace

HTTPSchedule::HTTPSchedule(const HTTPClient::Options& options)
    : _policy{options.retryFor, options.firstRetryAfter, kLongestWait, options.maximumWaiting},
      _maximumQueued(options.maximumQueued),
      _maximumActive(std::max<std::size_t>(options.maximumConnectionsPerHost, 1)),
      _maximumActivePosts(std::max<std::size_t>(_maximumActive - 1, 1)),
      _random(std::random_device{}()) {}

void HTTPSchedule::add(Exchange exchange) noexcept {
  Host* host = hostFor(*exchange);
  if (!host) {
    exchange->fail(outOfMemory());
  } else if (!exchange->isPost()) {
    host->requests.pushBack(std::move(exchange));
  } else if (host->outage && waiting() + exchange->request.body.size() > _policy.maximumWaiting) {
    exchange->fail(httpError(host->outage->kind, host->outage->description));
  } else if (_queuedCost + exchange->cost() > _maximumQueued) {
    forgetIfUnused(exchange->host());
    exchange->fail(httpError(HTTPError::Kind::Other, "too many posts wait to be sent"));
  } else {
    queuePost(*host, std::move(exchange), false);
  }
}

void HTTPSchedule::advance(Instant now) noexcept {
  while (!_retries.empty() && _retries.begin()->first <= now) {
    auto exchange = std::move(_retries.extract(_retries.begin()).mapped());
    _retryBytes -= exchange->request.body.size();
    Host& host = hostOf(*exchange);
    --host.retrying;
    queuePost(host, std::move(exchange), true);
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
}

HTTPSchedule::Exchange HTTPSchedule::next(Instant now) noexcept {
  for (auto& [name, host] : _hosts) {
    if (host.active >= _maximumActive) continue;
    Exchange exchange = host.requests.pop();
    if (!exchange && !host.posts.empty() && host.activePosts < _maximumActivePosts) {
      exchange = takePost(host);
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
  if (host.outage) {
    VESK_LOG_INFO("HTTPClient: %.*s answers again", static_cast<int>(exchange.host().size()),
                  exchange.host().data());
    host.outage.reset();
  }
  release(host, exchange);
}

void HTTPSchedule::failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now) noexcept {
  Host& host = hostOf(*exchange);
  if (exchange->isPost() && isOfTheHost(error)) beginOutage(host, *exchange, error, now);
  if (mayRetry && exchange->isPost() && keepForRetry(host, exchange, now)) return;
  release(host, *exchange);
  exchange->fail(std::move(error));
}

void HTTPSchedule::stopAllButPosts() noexcept {
  for (auto& [name, host] : _hosts) {
    while (auto request = host.requests.pop()) request->fail(stopped());
  }
}

void HTTPSchedule::stopAll() noexcept {
  stopAllButPosts();
  for (auto& [name, host] : _hosts) {
    while (auto post = host.posts.pop()) post->fail(stopped());
  }
  for (auto& [time, post] : _retries) post->fail(stopped());
  _hosts.clear();
  _retries.clear();
  _retryBytes = _queuedCost = 0;
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

HTTPSchedule::Host* HTTPSchedule::hostFor(const HTTPExchange& exchange) noexcept {
  auto found = _hosts.find(exchange.host());
  if (found != _hosts.end()) return &found->second;
  try {
    return &_hosts.try_emplace(std::string(exchange.host())).first->second;
  } catch (const std::bad_alloc&) {
    return nullptr;
  }
}

HTTPSchedule::Host& HTTPSchedule::hostOf(const HTTPExchange& exchange) noexcept {
  return _hosts.find(exchange.host())->second;
}

void HTTPSchedule::release(Host& host, const HTTPExchange& exchange) noexcept {
  --host.active;
  if (exchange.isPost()) --host.activePosts;
  forgetIfUnused(exchange.host());
}

void HTTPSchedule::forgetIfUnused(std::string_view name) noexcept {
  auto found = _hosts.find(name);
  const Host& host = found->second;
  if (host.active == 0 && host.requests.empty() && host.posts.empty() && host.retrying == 0) {
    _hosts.erase(found);
  }
}

void HTTPSchedule::queuePost(Host& host, Exchange exchange, bool first) noexcept {
  host.postBytes += exchange->request.body.size();
  _queuedCost += exchange->cost();
  if (first) {
    host.posts.pushFront(std::move(exchange));
  } else {
    host.posts.pushBack(std::move(exchange));
  }
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host) noexcept {
  Exchange exchange = host.posts.pop();
  host.postBytes -= exchange->request.body.size();
  _queuedCost -= exchange->cost();
  return exchange;
}

void HTTPSchedule::beginOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error,
                               Instant now) noexcept {
  if (!host.outage) {
    VESK_LOG_INFO("HTTPClient: no answer from %.*s: %s", static_cast<int>(exchange.host().size()),
                  exchange.host().data(), error.description.c_str());
  }
  host.outage = httpError(error.kind, error.description);
  // While a host swallows connections, few attempts fill its slots; posts behind them would wait without end.
  while (!host.posts.empty() && host.posts.front()->started + _policy.retryFor <= now) {
    takePost(host)->fail(httpError(error.kind, error.description));
  }
}

bool HTTPSchedule::keepForRetry(Host& host, Exchange& exchange, Instant now) noexcept {
  const std::size_t size = exchange->request.body.size();
  const double random = std::uniform_real_distribution<double>()(_random);
  auto wait = _policy.waitAfter(exchange->attempts, exchange->firstAttempt, now, waiting() + size, random);
  if (!wait) return false;
  try {
    Exchange& kept = _retries.emplace(now + *wait, nullptr)->second;
    ++host.retrying;
    release(host, *exchange);
    _retryBytes += size;
    kept = std::move(exchange);
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

std::size_t HTTPSchedule::waiting() const noexcept {
  std::size_t bytes = _retryBytes;
  for (const auto& [name, host] : _hosts) {
    if (host.outage) bytes += host.postBytes;
  }
  return bytes;
}

}  // namespace vesk
