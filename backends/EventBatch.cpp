#include "backends/EventBatch.h"

namespace vesk {

namespace {

// What a held event costs beyond its entries and texts: its place in the batch and the decoder's arena chunk.
constexpr std::size_t kOverhead = 1024;

}  // namespace

EventBatch::~EventBatch() { dropFront(_events.size()); }

void EventBatch::add(MutableDictionary event) {
  const std::size_t bytes = approximateMemory(event) + kOverhead;
  _events.push_back({std::move(event), bytes});
  *_account += bytes;
}

std::size_t EventBatch::dropOldest(std::size_t bound) {
  std::size_t count = 0;
  for (; *_account > bound && _events.size() > 1; ++count) dropFront(1);
  return count;
}

std::size_t EventBatch::addUserInfo(const Dictionary& userInfo, std::size_t bound) {
  const std::string_view marker = userInfo.begin()->key.view();
  const std::size_t growth = approximateMemory(userInfo);
  for (std::size_t left = _events.size(); left > 0; --left) {  // the newest first
    HeldEvent& held = _events[left - 1];
    if (held.event.contains(marker)) continue;
    if (*_account + growth > bound && left < _events.size()) {
      dropFront(left);
      return left;
    }
    held.event.setAll(userInfo);
    held.bytes += growth;
    *_account += growth;
  }
  return 0;
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
  for (; count > 0; --count) {
    *_account -= _events.front().bytes;
    _events.pop_front();
  }
}

}  // namespace vesk
