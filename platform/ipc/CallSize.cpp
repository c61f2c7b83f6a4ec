#include "platform/ipc/CallSize.h"

#include "platform/ipc/Codec.h"

namespace vesk {

namespace {

/// What a call's arguments come to: as they are held, and as the writer counts them.
struct Size {
  std::size_t memory = 0;
  std::size_t content = 0;
  std::size_t nodes = 0;
  bool isMemoryOnly = false;

  void count(std::size_t size) {
    ++nodes;
    content += size;
  }
  void contents(const Value& value) {
    count(kNodeContent);
    if (const Text* text = value.text()) count(text->size());
    if (const Bytes* bytes = value.bytes()) count(bytes->size());
    if (const Dictionary* dictionary = value.dictionary()) contents(*dictionary);
    if (const List* list = value.list()) {
      count(kNodeContent);
      for (const Value& item : *list) contents(item);
    }
  }
  void contents(const Dictionary& dictionary) {
    count(kNodeContent);
    for (const auto& entry : dictionary) {
      count(entry.key.size());
      contents(entry.value);
    }
  }

  void add(const std::string& text) {
    memory += text.size();
    count(text.size());
  }
  void add(const Dictionary& dictionary) {
    memory += approximateMemory(dictionary);
    if (!isMemoryOnly) contents(dictionary);
  }
  void add(const List& list) {
    memory += approximateMemory(Value(list));
    if (!isMemoryOnly) contents(Value(list));
  }
  void add(const std::vector<std::string>& texts) {
    memory += texts.size() * sizeof(std::string);
    content += texts.size() * kNodeContent;
    for (const auto& text : texts) add(text);
  }
  template <class T>
  void add(const std::optional<T>& argument) {
    if (argument) add(*argument);
  }
  template <class Fixed>
  void add(const Fixed&) {}  // a number or a descriptor
};

Size sizeOf(const IPCOutgoingCall& call, bool isMemoryOnly) {
  const std::size_t arguments = call.arguments.size();
  Size size{.memory = sizeof call + arguments * sizeof(IPCArgument),
            .content = sizeof call + arguments * kNodeContent,
            .isMemoryOnly = isMemoryOnly};
  for (const auto& argument : call.arguments) std::visit([&](const auto& held) { size.add(held); }, argument);
  return size;
}

}  // namespace

std::size_t approximateMemory(const IPCOutgoingCall& call) noexcept { return sizeOf(call, true).memory; }

bool isTooLarge(const IPCOutgoingCall& call, const CodecLimits& limits) noexcept {
  const Size size = sizeOf(call, false);
  return size.content > limits.content || size.nodes > limits.nodes;
}

}  // namespace vesk
