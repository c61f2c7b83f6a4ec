#include "platform/ipc/OneWayDecoder.h"

#include <algorithm>
#include <cctype>
#include <cstring>
#include <memory>

#include "platform/ipc/WireFormat.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

// Lists and dictionaries inside one another; what is deeper is rare.
constexpr std::size_t kDeepest = 16;
// Of a body that all texts of a call share. One short text keeps all of it, which has to stay small.
constexpr std::size_t kMostShared = 1024;

/// Reads values under D-Bus's alignment, which counts from the first byte. Every function returns whether it
/// found what it looks for, whole and by the rules.
class Reader {
 public:
  /// `owner` shares the life of the bytes with the texts that are read; without one they are copied.
  explicit Reader(std::string_view bytes, std::shared_ptr<const char> owner = nullptr)
      : _bytes(bytes), _owner(std::move(owner)) {}

  bool atEnd() const noexcept { return _at == _bytes.size(); }
  std::size_t content() const noexcept { return _content; }

  bool align(std::size_t to) {
    for (std::size_t end = (_at + to - 1) / to * to; _at < end; ++_at) {
      if (_at >= _bytes.size() || _bytes[_at] != '\0') return false;
    }
    return true;
  }
  template <class Number>
  bool number(Number& out) {
    if (!align(sizeof out) || _bytes.size() - _at < sizeof out) return false;
    std::memcpy(&out, _bytes.data() + _at, sizeof out);
    _at += sizeof out;
    return true;
  }
  bool rawText(std::string_view& out) {
    std::uint32_t size = 0;
    return number(size) && terminated(size, out);
  }
  bool signature(std::string_view& out) {
    std::uint8_t size = 0;
    return number(size) && terminated(size, out);
  }

  /// One argument, of the type that `types` begins with, which is taken from it.
  bool argument(std::string_view& types, std::vector<IPCArgument>& out);

 private:
  bool terminated(std::size_t size, std::string_view& out) {
    if (_bytes.size() - _at <= size || _bytes[_at + size] != '\0') return false;
    out = _bytes.substr(_at, size);
    _at += size + 1;
    return true;
  }
  bool text(Text& out) {
    std::string_view view;
    if (!rawText(view) || !isValidUTF8(view, false)) return false;
    _content += view.size();
    out = _owner ? Text(std::shared_ptr<const char>(_owner, view.data()), view.size()) : _arena.add(view);
    return true;
  }
  /// `elements` must read exactly up to the end that it is given.
  template <class Elements>
  bool array(std::size_t alignment, const Elements& elements) {
    std::uint32_t size = 0;
    if (!number(size) || !align(alignment) || _bytes.size() - _at < size) return false;
    const std::size_t end = _at + size;
    return elements(end) && _at == end;
  }
  template <class Number, class As>
  bool numberValue(Value& out) {
    Number value{};
    if (!number(value)) return false;
    out = static_cast<As>(value);
    return true;
  }
  bool boolean(bool& out) {
    std::uint32_t value = 0;
    if (!number(value) || value > 1) return false;
    out = value == 1;
    return true;
  }
  bool dictionary(Dictionary& out);
  bool list(List& out);
  bool bytes(Value& out);
  bool variant(Value& out);
  bool basic(char type, Value& out);
  bool container(std::string_view type, Value& out);

  const std::string_view _bytes;
  const std::shared_ptr<const char> _owner;
  TextArena _arena;
  std::size_t _at = 0;
  std::size_t _depth = 0;
  std::size_t _content = 0;
};

bool Reader::dictionary(Dictionary& out) {
  _content += kNodeContent;
  if (++_depth > kDeepest) return false;
  MutableDictionary building;
  bool read = array(8, [&](std::size_t end) {
    if (_at < end) building.reserve(8);
    while (_at < end) {
      Text key;
      Value value;
      if (!align(8) || !text(key) || !variant(value)) return false;
      building.append(std::move(key), std::move(value));
    }
    return true;
  });
  --_depth;
  if (read) out = building.shareUnique();
  return read;
}

bool Reader::list(List& out) {
  _content += kNodeContent;
  if (++_depth > kDeepest) return false;
  std::vector<Value> values;
  bool read = array(1, [&](std::size_t end) {
    while (_at < end) {
      if (!variant(values.emplace_back())) return false;
    }
    return true;
  });
  --_depth;
  if (read) out = List(std::move(values));
  return read;
}

bool Reader::bytes(Value& out) {
  return array(1, [&](std::size_t end) {
    _content += kNodeContent + end - _at;
    out = Bytes(std::string(_bytes.substr(_at, end - _at)));
    _at = end;
    return true;
  });
}

bool Reader::variant(Value& out) {
  std::string_view type;
  if (!signature(type)) return false;
  return type.size() == 1 ? basic(type[0], out) : container(type, out);
}

bool Reader::basic(char type, Value& out) {
  _content += kNodeContent;
  switch (type) {
    case 's': {
      Text value;
      if (!text(value)) return false;
      out = std::move(value);
      return true;
    }
    case 'b': {
      bool value = false;
      if (!boolean(value)) return false;
      out = value;
      return true;
    }
    case 'g': {
      // The empty signature is the null marker.
      std::string_view empty;
      out = Value();
      return signature(empty) && empty.empty();
    }
    case 'y':
      return numberValue<std::uint8_t, std::uint64_t>(out);
    case 'n':
      return numberValue<std::int16_t, std::int64_t>(out);
    case 'q':
      return numberValue<std::uint16_t, std::uint64_t>(out);
    case 'i':
      return numberValue<std::int32_t, std::int64_t>(out);
    case 'u':
      return numberValue<std::uint32_t, std::uint64_t>(out);
    case 'x':
      return numberValue<std::int64_t, std::int64_t>(out);
    case 't':
      return numberValue<std::uint64_t, std::uint64_t>(out);
    case 'd':
      return numberValue<double, double>(out);
    default:
      return false;
  }
}

bool Reader::container(std::string_view type, Value& out) {
  if (type == "a{sv}") {
    Dictionary value;
    if (!dictionary(value)) return false;
    out = std::move(value);
    return true;
  }
  if (type == "av") {
    List value;
    if (!list(value)) return false;
    out = std::move(value);
    return true;
  }
  if (type == "ay") return bytes(out);
  if (type == "(d)") {
    Date value;
    _content += kNodeContent;
    if (!align(8) || !number(value.secondsSince1970)) return false;
    out = value;
    return true;
  }
  return false;
}

template <class T>
T& added(std::vector<IPCArgument>& arguments) {
  return std::get<T>(arguments.emplace_back(std::in_place_type<T>));
}

bool Reader::argument(std::string_view& types, std::vector<IPCArgument>& out) {
  auto takes = [&](std::string_view type) {
    if (!types.starts_with(type)) return false;
    types.remove_prefix(type.size());
    return true;
  };
  if (takes("a{sv}")) return dictionary(added<Dictionary>(out));
  if (takes("aa{sv}")) {
    auto& maybe = added<std::optional<Dictionary>>(out);
    return array(4, [&](std::size_t end) { return _at == end || dictionary(maybe.emplace()); });
  }
  if (takes("av")) return list(added<List>(out));
  if (takes("q")) return number(added<std::uint16_t>(out));
  if (takes("b")) return boolean(added<bool>(out));
  return false;
}

bool isMemberName(std::string_view name) {
  return !name.empty() && std::all_of(name.begin(), name.end(), [](unsigned char c) {
    return c == '_' || (c < 0x80 && std::isalnum(c));
  });
}

}  // namespace

bool OneWayDecoder::mayDecode(std::string_view header, std::uint64_t size) noexcept {
  return header[0] == kLittleEndian && header[1] == kMethodCall && header[2] == kNoReplyExpected &&
         size <= kMaximumMessage;
}

/// The names, into the fields of this; nothing new when the header is the last one's.
bool OneWayDecoder::readHeader(std::string_view message) {
  std::uint32_t bodySize = 0;
  std::memcpy(&bodySize, message.data() + kBodySizeAt, sizeof bodySize);
  if (!_header.empty() && message.size() - kFieldsSizeAt == _header.size() + bodySize &&
      message.substr(kFieldsSizeAt).starts_with(_header)) {
    return true;
  }
  auto header = message.substr(0, message.size() - bodySize);
  std::uint32_t fieldsSize = 0;
  std::memcpy(&fieldsSize, header.data() + kFieldsSizeAt, sizeof fieldsSize);
  const std::size_t fieldsEnd = kFixedHeader + fieldsSize;
  // Fields are aligned as the whole message is, and that part begins at a multiple of 8.
  Reader reader(header.substr(kFixedHeader, fieldsSize));
  std::string_view path;
  std::string_view interfaceName;
  std::string_view member;
  std::string_view signature;
  while (!reader.atEnd()) {
    std::uint8_t field = 0;
    std::string_view type;
    if (!reader.align(8) || !reader.number(field) || !reader.signature(type)) return false;
    std::string_view* name = field == kPath && type == "o"        ? &path
                             : field == kInterface && type == "s" ? &interfaceName
                             : field == kMember && type == "s"    ? &member
                             : field == kSignature && type == "g" ? &signature
                                                                  : nullptr;
    // Empty ones, and such as come twice, are left to sd-bus like all that is unknown.
    if (!name || !name->empty()) return false;
    if (!(field == kSignature ? reader.signature(*name) : reader.rawText(*name)) || name->empty())
      return false;
  }
  if (header.find_first_not_of('\0', fieldsEnd) != header.npos) return false;
  if (path != _objectPath || !isMemberName(member)) return false;
  _header = header.substr(kFieldsSizeAt);
  _interfaceName = interfaceName;
  _member = member;
  _signature = signature;
  return true;
}

std::optional<OneWayCall> OneWayDecoder::decode(std::string_view message) {
  if (!readHeader(message)) return std::nullopt;
  auto body = message.substr(kFieldsSizeAt + _header.size());
  std::shared_ptr<const char> owner;
  if (body.size() <= kMostShared) {
    auto copy = std::make_shared_for_overwrite<char[]>(body.size());
    std::memcpy(copy.get(), body.data(), body.size());
    owner = std::shared_ptr<const char>(copy, copy.get());
    body = {copy.get(), body.size()};
  }
  Reader reader(body, std::move(owner));

  OneWayCall call{_interfaceName, _member, _signature, {}};
  call.arguments.reserve(_signature.size());
  for (std::string_view types = _signature; !types.empty();) {
    if (!reader.argument(types, call.arguments)) return std::nullopt;
  }
  if (!reader.atEnd() || reader.content() > _limits.content) return std::nullopt;
  return call;
}

}  // namespace vesk
