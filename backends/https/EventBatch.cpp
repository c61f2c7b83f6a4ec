#include "backends/https/EventBatch.h"

namespace vesk {

namespace {

// What a held event costs beyond its entries and texts: its place in the batch and the decoder's arena chunk.
constexpr std::size_t kOverhead = 1024;

}  // namespace

EventBatch::~EventBatch() { dropFront(_events.size()); }

void EventBatch::add(MutableDictionary event) {
  const std::size_t bytes = approximateMemory(event) + kOverhead;
  _events.push_back({std::move(event), bytes});
  _account->add(bytes);
}

// An eighth at once, or all others would be at the limit with each of their events.
EventBatch::Dropped EventBatch::dropOldest() {
  Dropped dropped;
  for (const HeldAccount* account = _account.get(); account; account = account->wider()) {
    if (account->bytes() <= account->limit()) continue;
    const std::size_t kept = account->isOfSession() ? 1 : 0;
    const std::size_t before = dropped.count;
    for (; account->bytes() > account->limit() / 8 * 7 && _events.size() > kept; ++dropped.count) {
      dropFront(1);
    }
    if (dropped.count == before) continue;
    dropped.account = account;
    dropped.bound = account->limit();
  }
  return dropped;
}

EventBatch::Dropped EventBatch::addUserInfo(const Dictionary& userInfo) {
  constexpr std::size_t kTimes = 2;
  const std::string_view marker = userInfo.begin()->key.view();
  const std::size_t growth = approximateMemory(userInfo);
  for (std::size_t left = _events.size(); left > 0; --left) {  // the newest first
    HeldEvent& held = _events[left - 1];
    if (held.event.contains(marker)) continue;
    const HeldAccount* account = _account->exceeded(growth, kTimes);
    if (account && left < _events.size()) {
      dropFront(left);
      return {left, account, account->limit() * kTimes};
    }
    held.event.setAll(userInfo);
    held.bytes += growth;
    _account->add(growth);
  }
  return {};
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
