#include "backends/https/EventBatch.h"

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// A held event's memory beyond its entries and texts: its place in the batch and the decoder's arena chunk.
constexpr std::size_t kOverhead = 1024;
constexpr std::size_t kMostMethods = 65'536;

}  // namespace

EventBatch::~EventBatch() { dropFront(_events.size()); }

void EventBatch::add(MutableDictionary event) {
  const std::size_t bytes = approximateMemory(event) + kOverhead;
  _events.push_back({std::move(event), bytes});
  _account->add(bytes);
}

void EventBatch::add(MutableDictionary event, std::int64_t method) {
  add(std::move(event));
  ++_eventMethodCounts[method];
}

bool EventBatch::passesThreshold(std::int64_t method, std::int32_t threshold) {
  std::int32_t& count = _eventMethodCounts[method];
  if (count <= threshold) return false;
  count = 0;
  return true;
}

// Drops an eighth at once. Otherwise all other holders would be at the limit with each of their events.
std::size_t EventBatch::dropOldest(const std::string& backendName) {
  std::size_t dropped = 0;
  const HeldAccount* exceeded = nullptr;
  for (const HeldAccount* account = _account.get(); account; account = account->wider()) {
    if (account->bytes() <= account->limit()) continue;
    const std::size_t kept = account->isOfSession() ? 1 : 0;
    for (; account->bytes() > account->limit() / 8 * 7 && _events.size() > kept; ++dropped) {
      dropFront(1);
      exceeded = account;
    }
  }
  if (exceeded) logDropped(*exceeded, exceeded->limit(), backendName);
  if (_eventMethodCounts.size() > kMostMethods) _eventMethodCounts.clear();  // user info may name any number
  return dropped;
}

std::size_t EventBatch::addUserInfo(const Dictionary& userInfo, const std::string& backendName) {
  constexpr std::size_t kTimes = 2;
  const std::string_view marker = userInfo.begin()->key.view();
  const std::size_t growth = approximateMemory(userInfo);
  for (std::size_t left = _events.size(); left > 0; --left) {  // the newest first
    HeldEvent& held = _events[left - 1];
    if (held.event.contains(marker)) continue;
    const HeldAccount* account = _account->exceeded(growth, kTimes);
    if (account && left < _events.size()) {
      dropFront(left);
      logDropped(*account, account->limit() * kTimes, backendName);
      return left;
    }
    held.event.setAll(userInfo);
    held.bytes += growth;
    _account->add(growth);
  }
  return 0;
}

void EventBatch::logDropped(const HeldAccount& account, std::size_t bound, const std::string& backendName) {
  if (std::exchange(_hasLoggedDrop, true)) return;
  if (account.isOfSession()) {
    VESK_LOG_WARNING(
        "HTTPSPostBackend(batchEvent): backend %s holds more than %zu bytes: dropping its oldest events",
        backendName.c_str(), bound);
  } else {
    VESK_LOG_WARNING(
        "HTTPSPostBackend(batchEvent): %s holds more than %zu bytes: dropping the oldest events of backend "
        "%s",
        account.holder().c_str(), bound, backendName.c_str());
  }
}

void EventBatch::setSessionID(const std::optional<Text>& sessionID) {
  for (HeldEvent& held : _events) {
    if (sessionID) {
      held.event.set(Text::literal("_sessionID"), *sessionID);
    } else {
      held.event.remove("_sessionID");
    }
  }
}

void EventBatch::dropFront(std::size_t count) {
  std::size_t bytes = 0;
  for (; count > 0; --count) {
    bytes += _events.front().bytes;
    _events.pop_front();
  }
  if (bytes > 0) _account->remove(bytes);
}

}  // namespace vesk
