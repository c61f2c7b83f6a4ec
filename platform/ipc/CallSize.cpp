#include "platform/ipc/CallSize.h"

#include "platform/ipc/Codec.h"

namespace vesk {

namespace {

struct Memory {
  static constexpr std::size_t kCall = sizeof(IPCOutgoingCall);
  static constexpr std::size_t kArgument = sizeof(IPCArgument);
  static constexpr std::size_t kText = sizeof(std::string);

  static std::size_t ofText(const std::string& text) noexcept { return text.size(); }
  static std::size_t of(const Value& value) noexcept { return approximateMemory(value); }
  static std::size_t of(const Dictionary& dictionary) noexcept { return approximateMemory(dictionary); }
};

struct Content {
  static constexpr std::size_t kCall = sizeof(IPCOutgoingCall);
  static constexpr std::size_t kArgument = kNodeContent;
  static constexpr std::size_t kText = kNodeContent;

  static std::size_t ofText(const std::string& text) noexcept { return text.size(); }
  static std::size_t of(const Value& value) noexcept {
    std::size_t size = kNodeContent;
    if (const Text* text = value.text()) size += text->size();
    if (const Bytes* bytes = value.bytes()) size += bytes->size();
    if (const Dictionary* dictionary = value.dictionary()) size += of(*dictionary);
    if (const List* list = value.list()) {
      size += kNodeContent;
      for (const Value& item : *list) size += of(item);
    }
    return size;
  }
  static std::size_t of(const Dictionary& dictionary) noexcept {
    std::size_t size = kNodeContent;
    for (const auto& entry : dictionary) size += entry.key.size() + of(entry.value);
    return size;
  }
};

struct Nodes {
  static constexpr std::size_t kCall = 0;
  static constexpr std::size_t kArgument = 0;
  static constexpr std::size_t kText = 0;

  static std::size_t ofText(const std::string&) noexcept { return 1; }
  static std::size_t of(const Value& value) noexcept {
    if (const Dictionary* dictionary = value.dictionary()) return 1 + of(*dictionary);
    std::size_t count = value.text() || value.bytes() ? 2 : 1;
    if (const List* list = value.list()) {
      ++count;
      for (const Value& item : *list) count += of(item);
    }
    return count;
  }
  static std::size_t of(const Dictionary& dictionary) noexcept {
    std::size_t count = 1;
    for (const auto& entry : dictionary) count += 1 + of(entry.value);
    return count;
  }
};

/// What an argument comes to besides `Measure::kArgument`.
template <class Measure>
struct ArgumentSize {
  std::size_t operator()(const std::string& text) const noexcept { return Measure::ofText(text); }
  std::size_t operator()(const Dictionary& dictionary) const noexcept { return Measure::of(dictionary); }
  std::size_t operator()(const List& list) const noexcept { return Measure::of(Value(list)); }
  std::size_t operator()(const std::vector<std::string>& texts) const noexcept {
    std::size_t size = 0;
    for (const auto& text : texts) size += Measure::kText + Measure::ofText(text);
    return size;
  }
  template <class T>
  std::size_t operator()(const std::optional<T>& argument) const noexcept {
    return argument ? (*this)(*argument) : 0;
  }
  std::size_t operator()(bool) const noexcept { return 0; }
  std::size_t operator()(std::uint16_t) const noexcept { return 0; }
  std::size_t operator()(double) const noexcept { return 0; }
  std::size_t operator()(IPCDescriptor) const noexcept { return 0; }
};

template <class Measure>
std::size_t sizeOf(const IPCOutgoingCall& call) noexcept {
  std::size_t size = Measure::kCall;
  for (const auto& argument : call.arguments) {
    size += Measure::kArgument + std::visit(ArgumentSize<Measure>{}, argument);
  }
  return size;
}

}  // namespace

std::size_t approximateMemory(const IPCOutgoingCall& call) noexcept { return sizeOf<Memory>(call); }

bool isTooLarge(const IPCOutgoingCall& call, const CodecLimits& limits) noexcept {
  return sizeOf<Content>(call) > limits.content || sizeOf<Nodes>(call) > limits.nodes;
}

}  // namespace vesk
