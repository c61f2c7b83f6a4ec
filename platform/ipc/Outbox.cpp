#include "platform/ipc/Outbox.h"

#include "platform/ipc/BusCodec.h"

namespace vesk {

namespace {

constexpr std::size_t kNodeContent = 8;

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

struct ArgumentContent {
  std::size_t operator()(const std::string& text) const { return text.size(); }
  std::size_t operator()(const Dictionary& dictionary) const { return contentOf(dictionary); }
  std::size_t operator()(const List& list) const { return contentOf(Value(list)); }
  std::size_t operator()(const std::vector<std::string>& texts) const {
    std::size_t content = 0;
    for (const auto& text : texts) content += kNodeContent + text.size();
    return content;
  }
  template <class T>
  std::size_t operator()(const std::optional<T>& argument) const {
    return argument ? (*this)(*argument) : 0;
  }
  std::size_t operator()(bool) const { return 0; }
  std::size_t operator()(std::uint16_t) const { return 0; }
  std::size_t operator()(double) const { return 0; }
  std::size_t operator()(IPCDescriptor) const { return 0; }
};

std::size_t contentOf(const IPCOutgoingCall& call) {
  std::size_t content = sizeof call;
  for (const auto& argument : call.arguments) {
    content += kNodeContent + std::visit(ArgumentContent{}, argument);
  }
  return content;
}

}  // namespace

const char* Outbox::put(IPCOutgoingCall call) {
  std::size_t content = contentOf(call);
  if (content > CodecLimits{}.content) return "the call is too large";
  MutexLock lock(_mutex);
  if (_closed) return "the connection has ended";
  if (_entries.size() >= _maximumCalls || _content + content > kMaximumContent) {
    return "too many calls wait for the client";
  }
  _content += content;
  _entries.push_back({std::move(call), content});
  return nullptr;
}

std::optional<IPCOutgoingCall> Outbox::take() {
  MutexLock lock(_mutex);
  if (_entries.empty()) return std::nullopt;
  Entry entry = std::move(_entries.front());
  _entries.pop_front();
  _content -= entry.content;
  return std::move(entry.call);
}

bool Outbox::empty() const {
  MutexLock lock(_mutex);
  return _entries.empty();
}

std::size_t Outbox::close() {
  std::deque<Entry> forgotten;  // released after the lock
  MutexLock lock(_mutex);
  _closed = true;
  _content = 0;
  forgotten.swap(_entries);
  return forgotten.size();
}

}  // namespace vesk
