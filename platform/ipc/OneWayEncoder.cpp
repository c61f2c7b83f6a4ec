#include "platform/ipc/OneWayEncoder.h"

#include <cstring>
#include <string_view>
#include <type_traits>

#include "platform/ipc/WireFormat.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

/// Appends values under D-Bus's alignment, which counts from the start of the message.
class Writer {
 public:
  Writer(std::string& out, CodecLimits limits) noexcept : _out(out), _start(out.size()), _limits(limits) {}

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
    _out.append(text);
    byte('\0');
  }
  void signature(std::string_view text) {
    byte(static_cast<char>(text.size()));
    _out.append(text);
    byte('\0');
  }

  // The arguments, each as its type says.
  void add(bool value) { number(static_cast<std::uint32_t>(value ? 1 : 0)); }
  void add(std::uint16_t value) { number(value); }
  void add(double value) { number(value); }
  void add(std::string_view text) {
    if (!count(text.size())) return;
    if (!isValidUTF8(text, false)) return fail(CodecResult::Malformed);
    rawText(text);
  }
  void add(const std::string& text) { add(std::string_view(text)); }
  void add(const Dictionary& dictionary);
  void add(const List& list);
  void add(const Value& value);
  void add(const std::vector<std::string>& texts) {
    array(4, [&] {
      for (const auto& text : texts) add(std::string_view(text));
    });
  }
  template <class T>
  void add(const std::optional<T>& value) {
    array(4, [&] {
      if (value) add(*value);
    });
  }
  void add(IPCDescriptor) { fail(CodecResult::WrongType); }

 private:
  template <class Contents>
  void array(std::size_t alignment, const Contents& contents) {
    if (++_containers > kMaximumContainers) fail(CodecResult::LimitExceeded);
    number(std::uint32_t{0});
    std::size_t lengthAt = _out.size() - sizeof(std::uint32_t);
    align(alignment);
    std::size_t begin = _out.size();
    if (_result == CodecResult::Ok) contents();
    auto length = static_cast<std::uint32_t>(_out.size() - begin);
    std::memcpy(_out.data() + lengthAt, &length, sizeof length);
    --_containers;
  }

  /// The containers that `contents` opens for each of its elements, besides those that they open themselves.
  template <class Contents>
  void nested(std::size_t containers, const Contents& contents) {
    _containers += containers;
    if (++_depth > _limits.depth || _containers > kMaximumContainers) fail(CodecResult::LimitExceeded);
    if (_result == CodecResult::Ok) contents();
    --_depth;
    _containers -= containers;
  }

  bool count(std::size_t content) {
    _content += content;
    bool isWithin = ++_nodes <= _limits.nodes && _content <= _limits.content;
    if (!isWithin) fail(CodecResult::LimitExceeded);
    return _result == CodecResult::Ok;
  }
  void fail(CodecResult result) noexcept {
    if (_result == CodecResult::Ok) _result = result;
  }

  std::string& _out;
  const std::size_t _start;
  const CodecLimits _limits;
  std::size_t _depth = 0;
  std::size_t _containers = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

void Writer::add(const Dictionary& dictionary) {
  if (!count(kNodeContent)) return;
  array(8, [&] {
    nested(2, [&] {  // entry and variant
      for (const auto& entry : dictionary) {
        align(8);
        add(entry.key.view());
        add(entry.value);
        if (_result != CodecResult::Ok) return;
      }
    });
  });
}

void Writer::add(const List& list) {
  if (!count(kNodeContent)) return;
  array(1, [&] {
    nested(1, [&] {  // variant
      for (const auto& item : list) {
        add(item);
        if (_result != CodecResult::Ok) return;
      }
    });
  });
}

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
      auto bytes = value.bytes()->view();
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

// In the order of IPCArgument's alternatives.
constexpr const char* kSignatures[] = {"b", "q", "d", "s", "a{sv}", "av", "aa{sv}", "as", "as", "aas", "ah"};
static_assert(std::size(kSignatures) == std::variant_size_v<IPCArgument>);

void addField(Writer& writer, HeaderField field, const char* type, std::string_view value) {
  writer.align(8);
  writer.byte(static_cast<char>(field));
  writer.signature(type);
  if (field == kSignature) {
    writer.signature(value);
  } else {
    writer.rawText(value);
  }
}

}  // namespace

const std::string& OneWayEncoder::headerFor(const IPCOutgoingCall& call, const std::string& signature) {
  for (const Header& header : _headers) {
    if (header.member == call.member && header.interfaceName == call.interfaceName &&
        header.signature == signature) {
      return header.bytes;
    }
  }
  Header header{call.interfaceName, call.member, signature, {}};
  Writer writer(header.bytes, _limits);
  for (char byte : {kLittleEndian, kMethodCall, kNoReplyExpected, kProtocolVersion}) writer.byte(byte);
  writer.number(std::uint32_t{0});  // body length
  writer.number(std::uint32_t{0});  // serial
  writer.number(std::uint32_t{0});  // length of the fields
  std::size_t begin = header.bytes.size();
  addField(writer, kPath, "o", _objectPath);
  addField(writer, kInterface, "s", call.interfaceName);
  addField(writer, kMember, "s", call.member);
  if (!signature.empty()) addField(writer, kSignature, "g", signature);
  auto length = static_cast<std::uint32_t>(header.bytes.size() - begin);
  std::memcpy(header.bytes.data() + begin - sizeof length, &length, sizeof length);
  writer.align(8);
  _headers.push_back(std::move(header));
  return _headers.back().bytes;
}

CodecResult OneWayEncoder::append(const IPCOutgoingCall& call, std::uint32_t serial, std::string& out) {
  const std::size_t start = out.size();
  try {
    return appendTo(out, start, call, serial);
  } catch (...) {
    out.resize(start);  // or else the half of a message would be sent
    throw;
  }
}

CodecResult OneWayEncoder::appendTo(std::string& out, std::size_t start, const IPCOutgoingCall& call,
                                    std::uint32_t serial) {
  _signature.clear();
  for (const auto& argument : call.arguments) _signature += kSignatures[argument.index()];
  out += headerFor(call, _signature);

  const std::size_t body = out.size();
  Writer writer(out, _limits);  // the body begins at a multiple of 8
  for (const auto& argument : call.arguments) {
    std::visit([&](const auto& value) { writer.add(value); }, argument);
  }
  CodecResult result = writer.result();
  if (result == CodecResult::Ok && out.size() - start > kMaximumMessage) result = CodecResult::LimitExceeded;
  if (result != CodecResult::Ok) {
    out.resize(start);
    return result;
  }
  auto length = static_cast<std::uint32_t>(out.size() - body);
  std::memcpy(out.data() + start + kBodySizeAt, &length, sizeof length);
  std::memcpy(out.data() + start + kSerialAt, &serial, sizeof serial);
  return CodecResult::Ok;
}

}  // namespace vesk
