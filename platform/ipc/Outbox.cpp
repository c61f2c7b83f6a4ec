#include "platform/ipc/Outbox.h"

#include <utility>

#include "platform/ipc/CallSize.h"
#include "platform/ipc/Codec.h"

namespace vesk {

const char* Outbox::put(IPCOutgoingCall call) {
  if (isTooLarge(call, CodecLimits{})) return "the call is too large";
  const std::size_t memory = approximateMemory(call);
  MutexLock lock(_mutex);
  if (_closed) return "the connection has ended";
  if (_entries.size() >= _maximumCalls || (!_entries.empty() && _memory + memory > kMaximumMemory)) {
    return "too many calls wait for the client";
  }
  _entries.push_back({std::move(call), memory});
  _memory += memory;
  return nullptr;
}

std::optional<IPCOutgoingCall> Outbox::take() {
  MutexLock lock(_mutex);
  if (_entries.empty()) return std::nullopt;
  Entry entry = std::move(_entries.front());
  _entries.pop_front();
  _memory -= entry.memory;
  return std::move(entry.call);
}

void Outbox::lose() {
  MutexLock lock(_mutex);
  ++_lost;
}

bool Outbox::empty() const {
  MutexLock lock(_mutex);
  return _entries.empty();
}

std::size_t Outbox::close() {
  std::deque<Entry> forgotten;  // released after the lock
  MutexLock lock(_mutex);
  _closed = true;
  _memory = 0;
  forgotten.swap(_entries);
  return forgotten.size() + std::exchange(_lost, 0);
}

}  // namespace vesk
