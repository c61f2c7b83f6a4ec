#include "platform/http/HTTPSchedule.h"

#include <algorithm>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {
constexpr std::chrono::seconds kLongestWait{10};
}  // namespace

HTTPSchedule::HTTPSchedule(const HTTPClient::Options& options)
    : _policy{options.retryFor, options.firstRetryAfter, kLongestWait, options.maximumWaiting},
      _maximumQueued(options.maximumQueued),
      _maximumActive(std::max<std::size_t>(options.maximumConnectionsPerHost, 1)),
      _maximumActivePosts(std::max<std::size_t>(_maximumActive - 1, 1)),
      _random(std::random_device{}()) {}

void HTTPSchedule::add(Exchange exchange) {
  Host& host = hostOf(*exchange);
  if (!exchange->isPost()) {
    host.requests.push_back(std::move(exchange));
    return;
  }
  if (host.outage && waiting() + exchange->request.body.size() > _policy.maximumWaiting) {
    giveUp(std::move(exchange), *host.outage);
  } else if (_queuedCost + exchange->cost() > _maximumQueued) {
    auto name = std::string(exchange->host());
    giveUp(std::move(exchange), {HTTPError::Kind::Other, "too many posts wait to be sent"});
    forgetIfUnused(name);
  } else {
    queuePost(host, std::move(exchange), false);
  }
}

void HTTPSchedule::advance(Instant now) {
  while (!_retries.empty() && _retries.begin()->first <= now) {
    auto exchange = std::move(_retries.extract(_retries.begin()).mapped());
    _retryBytes -= exchange->request.body.size();
    Host& host = hostOf(*exchange);
    --host.retrying;
    queuePost(host, std::move(exchange), true);
  }
  for (auto& [name, host] : _hosts) {
    for (auto& request : host.requests) {
      if (request->deadline() > now) continue;
      giveUp(std::move(request), {HTTPError::Kind::Timeout, "timed out before a connection was free"});
    }
    std::erase(host.requests, nullptr);
  }
}

HTTPSchedule::Exchange HTTPSchedule::next(Instant now) {
  for (auto& [name, host] : _hosts) {
    if (host.active >= _maximumActive) continue;
    Exchange exchange;
    if (!host.requests.empty()) {
      exchange = std::move(host.requests.front());
      host.requests.pop_front();
    } else if (!host.posts.empty() && host.activePosts < _maximumActivePosts) {
      exchange = takePost(host);
      ++host.activePosts;
    } else {
      continue;
    }
    ++host.active;
    if (exchange->attempts++ == 0) exchange->firstAttempt = now;
    return exchange;
  }
  return nullptr;
}

void HTTPSchedule::answered(const HTTPExchange& exchange) {
  Host& host = hostOf(exchange);
  if (host.outage) {
    VESK_LOG_INFO("HTTPClient: %.*s answers again", static_cast<int>(exchange.host().size()),
                  exchange.host().data());
    host.outage.reset();
  }
  release(host, exchange);
}

void HTTPSchedule::failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now) {
  Host& host = hostOf(*exchange);
  if (exchange->isPost() && error.kind != HTTPError::Kind::BadURL) {
    if (!host.outage) {
      VESK_LOG_INFO("HTTPClient: no answer from %.*s: %s", static_cast<int>(exchange->host().size()),
                    exchange->host().data(), error.description.c_str());
    }
    host.outage = error;
    giveUpOverdue(host, error, now);
  }
  std::optional<RetryPolicy::Duration> wait;
  std::size_t size = exchange->request.body.size();
  if (mayRetry && exchange->isPost()) {
    double random = std::uniform_real_distribution<double>()(_random);
    wait = _policy.waitAfter(exchange->attempts, exchange->firstAttempt, now, waiting() + size, random);
  }
  if (wait) ++host.retrying;
  release(host, *exchange);
  if (wait) {
    _retryBytes += size;
    _retries.emplace(now + *wait, std::move(exchange));
  } else {
    giveUp(std::move(exchange), std::move(error));
  }
}

std::vector<HTTPSchedule::GivenUp> HTTPSchedule::takeGivenUp() { return std::exchange(_givenUp, {}); }

std::vector<HTTPSchedule::Exchange> HTTPSchedule::takeAll() {
  std::vector<Exchange> all;
  for (auto& [name, host] : _hosts) {
    for (auto& exchange : host.requests) all.push_back(std::move(exchange));
    for (auto& exchange : host.posts) all.push_back(std::move(exchange));
  }
  for (auto& [time, exchange] : _retries) all.push_back(std::move(exchange));
  for (auto& entry : _givenUp) all.push_back(std::move(entry.exchange));
  _hosts.clear();
  _retries.clear();
  _givenUp.clear();
  _retryBytes = _queuedCost = 0;
  return all;
}

std::optional<HTTPSchedule::Instant> HTTPSchedule::nextAdvance() const {
  std::optional<Instant> next;
  auto consider = [&next](Instant time) {
    if (!next || time < *next) next = time;
  };
  if (!_retries.empty()) consider(_retries.begin()->first);
  for (const auto& [name, host] : _hosts) {
    for (const auto& request : host.requests) consider(request->deadline());
  }
  return next;
}

HTTPSchedule::Host& HTTPSchedule::hostOf(const HTTPExchange& exchange) {
  auto found = _hosts.find(exchange.host());
  if (found == _hosts.end()) found = _hosts.emplace(exchange.host(), Host{}).first;
  return found->second;
}

void HTTPSchedule::release(Host& host, const HTTPExchange& exchange) {
  --host.active;
  if (exchange.isPost()) --host.activePosts;
  forgetIfUnused(exchange.host());
}

void HTTPSchedule::forgetIfUnused(std::string_view name) {
  auto found = _hosts.find(name);
  const Host& host = found->second;
  if (host.active == 0 && host.requests.empty() && host.posts.empty() && host.retrying == 0) {
    _hosts.erase(found);
  }
}

void HTTPSchedule::queuePost(Host& host, Exchange exchange, bool first) {
  host.postBytes += exchange->request.body.size();
  _queuedCost += exchange->cost();
  if (first) {
    host.posts.push_front(std::move(exchange));
  } else {
    host.posts.push_back(std::move(exchange));
  }
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host) {
  Exchange exchange = std::move(host.posts.front());
  host.posts.pop_front();
  host.postBytes -= exchange->request.body.size();
  _queuedCost -= exchange->cost();
  return exchange;
}

void HTTPSchedule::giveUp(Exchange exchange, HTTPError error) {
  _givenUp.push_back({std::move(exchange), std::move(error)});
}

// While a host swallows connections, few attempts fill its slots; posts behind them would wait without end.
void HTTPSchedule::giveUpOverdue(Host& host, const HTTPError& error, Instant now) {
  while (!host.posts.empty() && host.posts.front()->started + _policy.retryFor <= now) {
    giveUp(takePost(host), error);
  }
}

std::size_t HTTPSchedule::waiting() const {
  std::size_t bytes = _retryBytes;
  for (const auto& [name, host] : _hosts) {
    if (host.outage) bytes += host.postBytes;
  }
  return bytes;
}

}  // namespace vesk
