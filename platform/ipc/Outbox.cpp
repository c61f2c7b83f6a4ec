#include "platform/ipc/Outbox.h"

#include <utility>

#include "platform/ipc/BusCodec.h"
#include "platform/ipc/WireFormat.h"

namespace vesk {

namespace {

std::size_t contentOf(const Dictionary& dictionary);

std::size_t contentOf(const Value& value) {
  std::size_t content = kNodeContent;
  if (const Text* text = value.text()) content += text->size();
  if (const Bytes* bytes = value.bytes()) content += bytes->size();
  if (const Dictionary* dictionary = value.dictionary()) content += contentOf(*dictionary);
  if (const List* list = value.list()) {
    for (const auto& item : *list) content += contentOf(item);
  }
  return content;
}

std::size_t contentOf(const Dictionary& dictionary) {
  std::size_t content = kNodeContent;
  for (const auto& entry : dictionary) content += entry.key.size() + contentOf(entry.value);
  return content;
}

/// As it will be sent, and as it is held.
struct Size {
  std::size_t content = 0;
  std::size_t memory = 0;

  Size& operator+=(Size other) {
    content += other.content;
    memory += other.memory;
    return *this;
  }
};

struct ArgumentSize {
  Size operator()(const std::string& text) const { return {text.size(), text.size()}; }
  Size operator()(const Dictionary& dictionary) const {
    return {contentOf(dictionary), approximateMemory(dictionary)};
  }
  Size operator()(const List& list) const { return {contentOf(Value(list)), approximateMemory(Value(list))}; }
  Size operator()(const std::vector<std::string>& texts) const {
    Size size;
    for (const auto& text : texts) size += {kNodeContent + text.size(), sizeof text + text.size()};
    return size;
  }
  template <class T>
  Size operator()(const std::optional<T>& argument) const {
    return argument ? (*this)(*argument) : Size();
  }
  Size operator()(bool) const { return {}; }
  Size operator()(std::uint16_t) const { return {}; }
  Size operator()(double) const { return {}; }
  Size operator()(IPCDescriptor) const { return {}; }
};

Size sizeOf(const IPCOutgoingCall& call) {
  Size size{sizeof call, sizeof call};
  for (const auto& argument : call.arguments) {
    size += {kNodeContent, sizeof argument};
    size += std::visit(ArgumentSize{}, argument);
  }
  return size;
}

}  // namespace

const char* Outbox::put(IPCOutgoingCall call) {
  const Size size = sizeOf(call);
  if (size.content > CodecLimits{}.content) return "the call is too large";
  MutexLock lock(_mutex);
  if (_closed) return "the connection has ended";
  if (_entries.size() >= _maximumCalls || (!_entries.empty() && _memory + size.memory > kMaximumMemory)) {
    return "too many calls wait for the client";
  }
  _entries.push_back({std::move(call), size.memory});
  _memory += size.memory;
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
