#include "platform/http/HTTPSchedule.h"

#include <algorithm>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {
constexpr std::chrono::seconds kLongestWait{10};
// A host that did not answer for this long is silent. Senders don't wait for it.
constexpr std::chrono::seconds kSilentAfter{10};
constexpr std::size_t kBackgroundConnections = 2;
constexpr char kTooMany[] = "too many posts wait to be sent";
}  // namespace

HTTPSchedule::HTTPSchedule(const HTTPClient::Options& options)
    : _policy{options.retryFor, options.firstRetryAfter, kLongestWait},
      _keeper(options.keeper),
      _maximumWaiting(options.maximumWaiting),
      _maximumMemory(options.maximumMemory),
      _maximumActive(std::max<std::size_t>(options.maximumConnectionsPerHost, 1)),
      _maximumActivePosts(std::max<std::size_t>(_maximumActive - 1, 1)),
      _random(std::random_device{}()) {}

void HTTPSchedule::add(Exchange exchange) {
  auto [entry, isNew] = _hosts.try_emplace(std::string(exchange->host()));
  Host& host = entry->second;
  if (isNew) host.lastAnswer = exchange->started;
  if (!exchange->isPost()) {
    auto& queue = exchange->request.isBackground ? host.background : host.requests;
    queue.push_back(std::move(exchange));
    return;
  }
  Lane& lane = host.lanes[exchange->request.owner];
  // If no other attempt will show whether the host is back, this post does not wait.
  const bool mustWait = host.outage && host.activePosts + host.queuedPosts > 0;
  if (mustWait && !makeRoom(waitingBodies, host, lane, exchange->bodySize(), _maximumWaiting)) {
    giveUp(std::move(exchange), *host.outage);
  } else if (!makeRoom(memory, host, lane, exchange->cost(), _maximumMemory)) {
    giveUp(std::move(exchange), {HTTPError::Kind::Other, kTooMany});
  } else {
    if (host.isSilent) exchange->discharge();
    lane.bodies += exchange->bodySize();
    lane.cost += exchange->cost();
    lane.posts.push_back(std::move(exchange));
    ++host.queuedPosts;
  }
}

void HTTPSchedule::advance(Instant now) {
  while (!_retries.empty() && _retries.begin()->first <= now) {
    Host& host = hostOf(*_retries.begin()->second);
    queueFirst(host, std::move(_retries.extract(_retries.begin()).mapped()));
  }
  for (auto& [name, host] : _hosts) {
    for (Queue* queue : {&host.requests, &host.background}) {
      std::erase_if(*queue, [now](Exchange& request) {
        if (request->deadline() > now) return false;
        request->fail({HTTPError::Kind::Timeout, "timed out before a connection was free"});
        return true;
      });
    }
    dischargeIfSilent(host, now);
    if (_keeper) giveUpLate(host, now);
  }
  std::erase_if(_hosts, isUnused);
}

HTTPSchedule::Exchange HTTPSchedule::next(Instant now) {
  for (auto& [name, host] : _hosts) {
    if (host.active >= _maximumActive) continue;
    Exchange exchange = takeFirst(host.requests);
    if (!exchange && host.activePosts < _maximumActivePosts && (exchange = takePost(host))) {
      ++host.activePosts;
    }
    if (!exchange && host.activeBackground < kBackgroundConnections &&
        (exchange = takeFirst(host.background))) {
      ++host.activeBackground;
    }
    if (!exchange) continue;
    ++host.active;
    if (exchange->attempts++ == 0) exchange->firstAttempt = now;
    return exchange;
  }
  return nullptr;
}

void HTTPSchedule::answered(const HTTPExchange& exchange, Instant now) {
  Host& host = hostOf(exchange);
  release(host, exchange);
  host.lastAnswer = now;
  host.isSilent = false;
  if (!host.outage) return;
  VESK_LOG_INFO("HTTPClient: %.*s answers again", static_cast<int>(exchange.host().size()),
                exchange.host().data());
  host.outage.reset();
  bringBack(host);
}

void HTTPSchedule::failed(Exchange exchange, Failure failure, Instant now) {
  Host& host = hostOf(*exchange);
  release(host, *exchange);
  if (exchange->isPost() && failure.error.kind != HTTPError::Kind::BadURL) {
    noteOutage(host, *exchange, failure.error);
    exchange->discharge();
    dischargeIfSilent(host, now);
    // A few attempts fill the slots of a host that swallows connections; posts behind them would wait for
    // ever.
    if (exchange->firstAttempt + _policy.retryFor <= now) giveUpLate(host, now);
  }
  if (failure.mayRetry && exchange->isPost() && keepForRetry(host, exchange, failure.wasSentWhole, now))
    return;
  if (failure.mayKeep) {
    exchange->giveUp(std::move(failure.error), _keeper,
                     failure.wasSentWhole ? kWaitAfterWholeBody : std::chrono::seconds(0));
  } else {
    if (exchange->ticket != 0) _keeper->discard(exchange->ticket);
    exchange->fail(std::move(failure.error));
  }
}

void HTTPSchedule::stopAllButPosts() {
  for (auto& [name, host] : _hosts) {
    while (auto request = takeFirst(host.requests)) request->fail(stopped());
    while (auto request = takeFirst(host.background)) request->fail(stopped());
  }
  if (std::exchange(_ending, true)) return;
  for (auto& [name, host] : _hosts) {
    bringBack(host);
    if (!_keeper || !host.outage) continue;
    while (auto post = takePost(host)) giveUp(std::move(post), *host.outage);
  }
}

void HTTPSchedule::stopAll() {
  stopAllButPosts();
  for (auto& [name, host] : _hosts) {
    bringBack(host);
    while (auto post = takePost(host)) giveUp(std::move(post), stopped());
  }
  _hosts.clear();
}

std::optional<HTTPSchedule::Instant> HTTPSchedule::nextAdvance() const {
  std::optional<Instant> next;
  auto consider = [&next](std::optional<Instant> time) {
    if (time && (!next || *time < *next)) next = time;
  };
  if (!_retries.empty()) consider(_retries.begin()->first);
  for (const auto& [name, host] : _hosts) {
    for (const auto& request : host.requests) consider(request->deadline());
    for (const auto& request : host.background) consider(request->deadline());
    if (host.queuedPosts > 0 && !host.isSilent) consider(host.lastAnswer + kSilentAfter);
    if (!_keeper) continue;
    for (const auto& [owner, lane] : host.lanes) {
      if (!lane.posts.empty()) consider(endOfWait(host, *lane.posts.front()));
    }
  }
  return next;
}

std::size_t HTTPSchedule::memory(const Host&, const Lane& lane) { return lane.cost; }

std::size_t HTTPSchedule::waitingBodies(const Host& host, const Lane& lane) {
  return host.outage ? lane.bodies : 0;
}

bool HTTPSchedule::isUnused(const Hosts::value_type& entry) {
  const Host& host = entry.second;
  return !host.outage && host.active == 0 && host.requests.empty() && host.background.empty() &&
         std::all_of(host.lanes.begin(), host.lanes.end(),
                     [](const auto& lane) { return lane.second.cost == 0; });
}

HTTPSchedule::Exchange HTTPSchedule::takeFirst(Queue& queue) {
  if (queue.empty()) return nullptr;
  Exchange first = std::move(queue.front());
  queue.pop_front();
  return first;
}

HTTPSchedule::Host& HTTPSchedule::hostOf(const HTTPExchange& exchange) {
  return _hosts.find(exchange.host())->second;
}

HTTPSchedule::Lane& HTTPSchedule::laneOf(Host& host, const HTTPExchange& exchange) {
  return host.lanes[exchange.request.owner];
}

void HTTPSchedule::queueFirst(Host& host, Exchange post) {
  Lane& lane = laneOf(host, *post);
  lane.posts.push_front(std::move(post));
  ++host.queuedPosts;
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host) {
  auto lane = host.lanes.upper_bound(host.lastServed);
  for (std::size_t i = 0; i < host.lanes.size(); ++i, ++lane) {
    if (lane == host.lanes.end()) lane = host.lanes.begin();
    if (lane->second.posts.empty()) continue;
    host.lastServed = lane->first;
    return takePost(host, lane->second);
  }
  return nullptr;
}

HTTPSchedule::Exchange HTTPSchedule::takePost(Host& host, Lane& lane) {
  Exchange post = takeFirst(lane.posts);
  if (!post) return nullptr;
  --host.queuedPosts;
  lane.bodies -= post->bodySize();
  lane.cost -= post->cost();
  return post;
}

// Waits are spread to spare servers with many devices. One device's posts resume immediately, oldest first.
void HTTPSchedule::bringBack(Host& host) {
  std::multimap<Instant, Exchange> back;
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
                            std::size_t bound) {
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
    giveUpOne(*hostOfFullest, *fullest);
  }
}

void HTTPSchedule::giveUpOne(Host& host, Lane& lane) {
  Exchange post = takePost(host, lane);
  for (auto each = _retries.begin(); !post; ++each) {
    if (&laneOf(hostOf(*each->second), *each->second) != &lane) continue;
    post = std::move(_retries.extract(each).mapped());
    lane.bodies -= post->bodySize();
    lane.cost -= post->cost();
    break;
  }
  giveUp(std::move(post), host.outage ? *host.outage : HTTPError{HTTPError::Kind::Other, kTooMany});
}

// A host that was not heard of for so long, although all its connections are in use, counts as one in an
// outage.
std::optional<HTTPSchedule::Instant> HTTPSchedule::endOfWait(const Host& host,
                                                             const HTTPExchange& post) const {
  if (!host.outage && host.activePosts < _maximumActivePosts) return std::nullopt;
  return (host.outage ? post.started : std::max(post.started, host.lastAnswer)) + _policy.retryFor;
}

void HTTPSchedule::dischargeIfSilent(Host& host, Instant now) {
  if (host.isSilent || (!host.outage && host.lastAnswer + kSilentAfter > now)) return;
  host.isSilent = true;
  for (auto& [owner, lane] : host.lanes) {
    for (auto& post : lane.posts) post->discharge();
  }
}

void HTTPSchedule::giveUpLate(Host& host, Instant now) {
  for (auto& [owner, lane] : host.lanes) {
    while (!lane.posts.empty()) {
      const auto end = endOfWait(host, *lane.posts.front());
      if (!end || *end > now) break;
      giveUp(takePost(host, lane),
             host.outage ? *host.outage : HTTPError{HTTPError::Kind::Timeout, "the server does not answer"});
    }
  }
}

bool HTTPSchedule::isLongOutage(const Host& host, Instant now) const {
  return _keeper && host.outage && host.lastAnswer + _policy.retryFor <= now;
}

void HTTPSchedule::release(Host& host, const HTTPExchange& exchange) {
  --host.active;
  if (exchange.isPost()) --host.activePosts;
  if (exchange.request.isBackground) --host.activeBackground;
}

void HTTPSchedule::noteOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error) {
  if (!host.outage) {
    VESK_LOG_INFO("HTTPClient: no answer from %.*s: %s", static_cast<int>(exchange.host().size()),
                  exchange.host().data(), error.description.c_str());
  }
  host.outage = error;
}

bool HTTPSchedule::keepForRetry(Host& host, Exchange& exchange, bool wasSentWhole, Instant now) {
  // What the keeper has, or can have, need not wait here.
  if (_keeper && (_ending || exchange->ticket != 0 || wasSentWhole)) return false;
  // In a long outage one post goes on trying. Others are tried once, since the host may be back.
  if (isLongOutage(host, now) && std::any_of(host.lanes.begin(), host.lanes.end(),
                                             [](const auto& lane) { return lane.second.cost > 0; })) {
    return false;
  }
  const double random = std::uniform_real_distribution<double>()(_random);
  auto wait = _policy.waitAfter(exchange->attempts, exchange->firstAttempt, now, random);
  Lane& lane = laneOf(host, *exchange);
  if (!wait || !makeRoom(waitingBodies, host, lane, exchange->bodySize(), _maximumWaiting) ||
      !makeRoom(memory, host, lane, exchange->cost(), _maximumMemory)) {
    return false;
  }
  lane.bodies += exchange->bodySize();
  lane.cost += exchange->cost();
  _retries.emplace(now + *wait, std::move(exchange));
  return true;
}

}  // namespace vesk
