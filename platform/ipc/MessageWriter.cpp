#include "platform/ipc/MessageWriter.h"

#include <cstring>
#include <iterator>
#include <optional>
#include <span>
#include <type_traits>

#include "platform/ipc/Signature.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

using namespace std::string_view_literals;

// The signatures of a value's variant as they are written, with length and NUL, in the order of Value::Kind.
// The empty signature is the null marker.
constexpr std::string_view kValueSignatures[] = {"\1g\0"sv,  "\1b\0"sv,    "\1x\0"sv,  "\1t\0"sv,
                                                 "\1d\0"sv,  "\1s\0"sv,    "\2ay\0"sv, "\3(d)\0"sv,
                                                 "\2av\0"sv, "\5a{sv}\0"sv};

/// Appends values with D-Bus's alignment, relative to its start.
class Writer {
 public:
  explicit Writer(std::string& out, CodecLimits limits = {}) noexcept
      : _out(out), _start(out.size()), _limits(limits) {}

  CodecResult result() const noexcept { return _result; }

  /// `to`: a power of two.
  void align(std::size_t to) {
    const std::size_t padding = (_start - _out.size()) & (to - 1);
    if (padding > 0) _out.append(padding, '\0');
  }
  void byte(char value) { _out.push_back(value); }
  template <class Number>
  void number(Number value) {
    align(sizeof value);
    char bytes[sizeof value];
    std::memcpy(bytes, &value, sizeof value);
    _out.append(bytes, sizeof bytes);
  }
  void rawText(std::string_view text) {
    number(static_cast<std::uint32_t>(text.size()));
    _out.append(text).push_back('\0');
  }
  void signature(std::string_view text) {
    byte(static_cast<char>(text.size()));
    _out.append(text).push_back('\0');
  }

  // Each writes the D-Bus type of its argument.
  template <class Number>
  requires std::is_arithmetic_v<Number>
  void add(Number value) { number(value); }
  void add(bool value) { number(std::uint32_t{value}); }
  void add(std::monostate) { signature(""); }
  void add(const Text& text) { addText(text.view()); }
  void add(const std::string& text) { addText(text); }
  void add(const Bytes& bytes) { addBytes(bytes.view()); }
  void add(Date date) {
    align(8);
    number(date.secondsSince1970);
  }
  void add(const Value& value) {  // as a variant
    if (!count(kNodeContent)) return;
    _out.append(kValueSignatures[static_cast<std::size_t>(value.kind())]);
    value.visit([this](const auto& held) { add(held); });
  }
  void add(const Dictionary& dictionary) {
    nested(8, 2, dictionary, [this](const DictionaryEntry& entry) {  // entry and variant
      align(8);
      add(entry.key);
      add(entry.value);
    });
  }
  void add(const List& list) {
    nested(1, 1, list, [this](const Value& item) { add(item); });  // variant
  }
  void add(const VeskDictionaryView& view) {
    nested(8, 2, std::span(view.entries, view.count), [this](const VeskEntryView& entry) {
      align(8);
      addText(shown(entry.key));
      add(entry.value);
    });
  }
  void add(const VeskValueView& view) {  // as a variant
    if (view.kind >= std::size(kValueSignatures)) return fail(CodecResult::Malformed);
    if (!count(kNodeContent)) return;
    _out.append(kValueSignatures[view.kind]);
    switch (view.kind) {
      case VeskValueNone:
        return add(std::monostate());
      case VeskValueBoolean:
        return add(view.as.boolean != 0);
      case VeskValueSigned:
        return add(view.as.signedInteger);
      case VeskValueUnsigned:
        return add(view.as.unsignedInteger);
      case VeskValueDouble:
        return add(view.as.real);
      case VeskValueText:
        return addText(shown(view.as.text));
      case VeskValueBytes:
        return addBytes(shown(view.as.bytes));
      case VeskValueDate:
        return add(Date{view.as.secondsSince1970});
      case VeskValueList:
        return nested(1, 1, std::span(view.as.list.values, view.as.list.count),
                      [this](const VeskValueView& item) { add(item); });
      case VeskValueDictionary:
        return add(view.as.dictionary);
    }
  }
  void add(const std::vector<std::string>& texts) {
    array(4, [&] {
      for (const auto& text : texts) addText(text);
    });
  }
  template <class T>
  void add(const std::optional<T>& value) {
    array(4, [&] {
      if (value) add(*value);
    });
  }
  void add(IPCDescriptor descriptor) {
    array(4, [&] {
      if (descriptor.borrowed >= 0) number(_descriptors++);
    });
  }

 private:
  template <class Contents>
  void array(std::size_t alignment, const Contents& contents) {
    if (++_containers > kMaximumContainers) fail(CodecResult::LimitExceeded);
    number(std::uint32_t{0});
    const std::size_t sizeAt = _out.size() - sizeof(std::uint32_t);
    align(alignment);
    const std::size_t begin = _out.size();
    if (_result == CodecResult::Ok) contents();
    const auto size = static_cast<std::uint32_t>(_out.size() - begin);
    std::memcpy(_out.data() + sizeAt, &size, sizeof size);
    --_containers;
  }

  /// Writes an array of values whose elements each open `containers`, not counting those of their contents.
  template <class Elements, class AddOne>
  void nested(std::size_t alignment, std::size_t containers, const Elements& elements, const AddOne& addOne) {
    if (!count(kNodeContent)) return;
    array(alignment, [&] {
      _containers += containers;
      if (++_depth > _limits.depth || _containers > kMaximumContainers) fail(CodecResult::LimitExceeded);
      for (const auto& element : elements) {
        if (_result != CodecResult::Ok) break;
        addOne(element);
      }
      --_depth;
      _containers -= containers;
    });
  }

  static std::string_view shown(VeskTextView text) noexcept {
    return text.data ? std::string_view(text.data, text.length) : std::string_view();
  }

  void addBytes(std::string_view bytes) {
    if (!count(bytes.size())) return;
    number(static_cast<std::uint32_t>(bytes.size()));
    _out.append(bytes);
  }
  void addText(std::string_view text) {
    if (!count(text.size())) return;
    if (!isValidUTF8(text, false)) return fail(CodecResult::Malformed);
    rawText(text);
  }
  bool count(std::size_t content) {
    if (_result != CodecResult::Ok) return false;
    _content += content;
    if (++_nodes <= _limits.nodes && _content <= _limits.content) return true;
    fail(CodecResult::LimitExceeded);
    return false;
  }
  void fail(CodecResult result) {
    if (_result == CodecResult::Ok) _result = result;
  }

  std::string& _out;
  const std::size_t _start;
  const CodecLimits _limits;
  std::uint32_t _descriptors = 0;
  std::size_t _depth = 0;
  std::size_t _containers = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

template <class T>
void addField(Writer& writer, HeaderField field, const char* type, T value) {
  if (value == T{}) return;
  writer.align(8);
  writer.byte(static_cast<char>(field));
  writer.signature(type);
  if constexpr (std::is_integral_v<T>) {
    writer.number(value);
  } else {
    *type == 'g' ? writer.signature(value) : writer.rawText(value);
  }
}

std::uint32_t descriptorsAmong(const std::vector<IPCArgument>& arguments) {
  std::uint32_t count = 0;
  for (const auto& argument : arguments) {
    const auto* descriptor = std::get_if<IPCDescriptor>(&argument);
    if (descriptor && descriptor->borrowed >= 0) ++count;
  }
  return count;
}

/// Writes the header, without body size and serial number.
void appendHeader(const OutgoingHeader& header, std::string_view signature, std::uint32_t descriptors,
                  std::string& out) {
  Writer writer(out);
  writer.byte(kLittleEndian);
  writer.byte(static_cast<char>(header.type));
  writer.byte(header.expectsReply ? '\0' : kNoReplyExpected);
  writer.byte(kProtocolVersion);
  for (int i = 0; i < 3; ++i) writer.number(std::uint32_t{0});
  const std::size_t begin = out.size();
  addField(writer, kPath, "o", header.path);
  addField(writer, kInterface, "s", header.interfaceName);
  addField(writer, kMember, "s", header.member);
  addField(writer, kErrorName, "s", header.errorName);
  addField(writer, kReplySerial, "u", header.replySerial);
  addField(writer, kSignature, "g", signature);
  addField(writer, kUnixDescriptors, "u", descriptors);
  const auto size = static_cast<std::uint32_t>(out.size() - begin);
  std::memcpy(out.data() + begin - sizeof size, &size, sizeof size);
  writer.align(8);
}

void appendSignature(const std::vector<IPCArgument>& arguments, std::string& out) {
  for (const auto& argument : arguments) out += kArgumentTypes[argument.index()];
}

/// Adds the body to the message whose header begins at `start`, and completes the header.
CodecResult appendBody(std::size_t start, std::uint32_t serial, const std::vector<IPCArgument>& arguments,
                       std::string& out, CodecLimits limits) {
  const std::size_t body = out.size();
  Writer writer(out, limits);  // the body begins at a multiple of 8
  for (const auto& argument : arguments) {
    std::visit([&](const auto& value) { writer.add(value); }, argument);
  }
  if (writer.result() != CodecResult::Ok) return writer.result();
  if (out.size() - start > kMaximumMessageSize) return CodecResult::LimitExceeded;
  const auto size = static_cast<std::uint32_t>(out.size() - body);
  std::memcpy(out.data() + start + kBodySizeAt, &size, sizeof size);
  std::memcpy(out.data() + start + kSerialAt, &serial, sizeof serial);
  return CodecResult::Ok;
}

/// Undoes what `append` has added unless it succeeds, so that a partial message is never sent.
template <class Append>
CodecResult wholeOrNothing(std::string& out, const Append& append) {
  const std::size_t start = out.size();
  try {
    const CodecResult result = append(start);
    if (result != CodecResult::Ok) out.resize(start);
    return result;
  } catch (...) {
    out.resize(start);
    throw;
  }
}

}  // namespace

const char* describe(CodecResult result) noexcept {
  // In the order of CodecResult.
  constexpr const char* kTexts[] = {"no error", "an argument is of the wrong type",
                                    "the arguments are too deep, too many or too large",
                                    "the arguments are malformed"};
  return kTexts[static_cast<std::size_t>(result)];
}

CodecResult appendMessage(const OutgoingHeader& header, std::uint32_t serial,
                          const std::vector<IPCArgument>& arguments, std::string& out, CodecLimits limits) {
  return wholeOrNothing(out, [&](std::size_t start) {
    std::string signature;
    appendSignature(arguments, signature);
    appendHeader(header, signature, descriptorsAmong(arguments), out);
    return appendBody(start, serial, arguments, out, limits);
  });
}

CodecResult appendCall(std::string_view objectPath, const IPCOutgoingCall& call, std::string& out) {
  return appendMessage({.path = objectPath, .interfaceName = call.interfaceName, .member = call.member}, 1,
                       call.arguments, out);
}

void stamp(char* message, std::uint32_t serial, bool expectsReply) noexcept {
  message[kFlagsAt] = expectsReply ? '\0' : kNoReplyExpected;
  std::memcpy(message + kSerialAt, &serial, sizeof serial);
}

}  // namespace vesk
