#include "platform/ipc/MessageWriter.h"

#include <cstring>
#include <iterator>
#include <optional>

#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

// In the order of IPCArgument's alternatives.
constexpr const char* kSignatures[] = {"b", "q", "d", "s", "a{sv}", "av", "aa{sv}", "as", "as", "aas", "ah"};
static_assert(std::size(kSignatures) == std::variant_size_v<IPCArgument>);

/// Appends values under D-Bus's alignment, which counts from where it begins.
class Writer {
 public:
  explicit Writer(std::string& out, CodecLimits limits = {}) noexcept
      : _out(out), _start(out.size()), _limits(limits) {}

  CodecResult result() const noexcept { return _result; }

  void align(std::size_t to) { _out.append((to - (_out.size() - _start) % to) % to, '\0'); }
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

  // Arguments, each as its type says.
  void add(bool value) { number(std::uint32_t{value}); }
  void add(std::uint16_t value) { number(value); }
  void add(double value) { number(value); }
  void add(std::string_view text) {
    if (!count(text.size())) return;
    if (!isValidUTF8(text, false)) return fail(CodecResult::Malformed);
    rawText(text);
  }
  void add(const std::string& text) { add(std::string_view(text)); }
  void add(const std::vector<std::string>& texts) {
    array(4, [&] {
      for (const auto& text : texts) add(std::string_view(text));
    });
  }
  void add(const Dictionary& dictionary);
  void add(const List& list);
  void add(const Value& value);
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

  /// An array whose elements open `containers` each, besides those that they open themselves.
  template <class Contents>
  void nested(std::size_t alignment, std::size_t containers, const Contents& contents) {
    if (!count(kNodeContent)) return;
    array(alignment, [&] {
      _containers += containers;
      if (++_depth > _limits.depth || _containers > kMaximumContainers) fail(CodecResult::LimitExceeded);
      if (_result == CodecResult::Ok) contents();
      --_depth;
      _containers -= containers;
    });
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

void Writer::add(const Dictionary& dictionary) {
  nested(8, 2, [&] {  // entry and variant
    for (const auto& entry : dictionary) {
      align(8);
      add(entry.key.view());
      add(entry.value);
      if (_result != CodecResult::Ok) return;
    }
  });
}

void Writer::add(const List& list) {
  nested(1, 1, [&] {  // variant
    for (const auto& item : list) {
      add(item);
      if (_result != CodecResult::Ok) return;
    }
  });
}

/// As a variant.
void Writer::add(const Value& value) {
  if (!count(kNodeContent)) return;
  switch (value.kind()) {
    case Value::Kind::None:
      signature("g");
      return signature("");
    case Value::Kind::Boolean:
      signature("b");
      return add(*value.boolean());
    case Value::Kind::Signed:
      signature("x");
      return number(*value.signedInteger());
    case Value::Kind::Unsigned:
      signature("t");
      return number(*value.unsignedInteger());
    case Value::Kind::Double:
      signature("d");
      return number(*value.real());
    case Value::Kind::Text:
      signature("s");
      return add(value.text()->view());
    case Value::Kind::Bytes: {
      const auto bytes = value.bytes()->view();
      if (!count(bytes.size())) return;
      signature("ay");
      number(static_cast<std::uint32_t>(bytes.size()));
      _out.append(bytes);
      return;
    }
    case Value::Kind::Date:
      signature("(d)");
      align(8);
      return number(value.date()->secondsSince1970);
    case Value::Kind::List:
      signature("av");
      return add(*value.list());
    case Value::Kind::Dictionary:
      signature("a{sv}");
      return add(*value.dictionary());
  }
}

void addField(Writer& writer, HeaderField field, const char* type, std::string_view value) {
  if (value.empty()) return;
  writer.align(8);
  writer.byte(static_cast<char>(field));
  writer.signature(type);
  if (field == kSignature) {
    writer.signature(value);
  } else {
    writer.rawText(value);
  }
}

void addField(Writer& writer, HeaderField field, std::uint32_t value) {
  if (value == 0) return;
  writer.align(8);
  writer.byte(static_cast<char>(field));
  writer.signature("u");
  writer.number(value);
}

std::uint32_t descriptorsAmong(const std::vector<IPCArgument>& arguments) {
  std::uint32_t count = 0;
  for (const auto& argument : arguments) {
    const auto* descriptor = std::get_if<IPCDescriptor>(&argument);
    if (descriptor && descriptor->borrowed >= 0) ++count;
  }
  return count;
}

/// Without body size and serial.
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
  addField(writer, kReplySerial, header.replySerial);
  addField(writer, kSignature, "g", signature);
  addField(writer, kUnixDescriptors, descriptors);
  const auto size = static_cast<std::uint32_t>(out.size() - begin);
  std::memcpy(out.data() + begin - sizeof size, &size, sizeof size);
  writer.align(8);
}

void appendSignature(const std::vector<IPCArgument>& arguments, std::string& out) {
  for (const auto& argument : arguments) out += kSignatures[argument.index()];
}

/// Adds the body to the message whose header begins at `start`, and completes that.
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

/// Takes back what `append` has added unless it succeeds, so that a partial message is never sent.
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
  switch (result) {
    case CodecResult::Ok:
      return "no error";
    case CodecResult::WrongType:
      return "an argument is of the wrong type";
    case CodecResult::LimitExceeded:
      return "the arguments are too deep, too many or too large";
    case CodecResult::Malformed:
      return "the arguments are malformed";
    case CodecResult::OutOfResources:
      return "no descriptor is left for the arguments";
  }
  return "unknown error";
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

const std::string& CallWriter::headerFor(const IPCOutgoingCall& call, const std::string& signature) {
  for (const Kept& kept : _kept) {
    if (kept.member == call.member && kept.interfaceName == call.interfaceName &&
        kept.signature == signature) {
      return kept.bytes;
    }
  }
  Kept kept{call.interfaceName, call.member, signature, {}};
  appendHeader({.path = _objectPath, .interfaceName = call.interfaceName, .member = call.member}, signature,
               0, kept.bytes);
  return _kept.emplace_back(std::move(kept)).bytes;
}

CodecResult CallWriter::append(const IPCOutgoingCall& call, std::uint32_t serial, bool expectsReply,
                               std::string& out) {
  if (descriptorsAmong(call.arguments) > 0) {
    return appendMessage({.expectsReply = expectsReply,
                          .path = _objectPath,
                          .interfaceName = call.interfaceName,
                          .member = call.member},
                         serial, call.arguments, out);
  }
  return wholeOrNothing(out, [&](std::size_t start) {
    _signature.clear();
    appendSignature(call.arguments, _signature);
    out += headerFor(call, _signature);
    if (expectsReply) out[start + kFlagsAt] = '\0';
    return appendBody(start, serial, call.arguments, out, {});
  });
}

}  // namespace vesk
