#include "platform/ipc/MessageReader.h"

#include <cstring>

#include "platform/ipc/Signature.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

// Texts of a body up to this size share one copy of it. One short text keeps all of it, so it has to stay
// small.
constexpr std::size_t kMaximumShared = 1024;

std::shared_ptr<const char> sharedCopy(std::string_view body) {
  if (body.empty() || body.size() > kMaximumShared) return nullptr;
  auto copy = std::make_shared_for_overwrite<char[]>(body.size());
  std::memcpy(copy.get(), body.data(), body.size());
  return std::shared_ptr<const char>(copy, copy.get());
}

}  // namespace

bool isObjectPath(std::string_view path) noexcept {
  if (path == "/") return true;
  if (!path.starts_with('/') || path.ends_with('/')) return false;
  for (std::size_t i = 1; i < path.size(); ++i) {
    const char c = path[i];
    const bool isWord =
        c == '_' || (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
    if (!isWord && (c != '/' || path[i - 1] == '/')) return false;
  }
  return true;
}

MessageReader::MessageReader(const Message& message, CodecLimits limits)
    : MessageReader(message.body, sharedCopy(message.body), message, limits) {}

MessageReader::MessageReader(std::string_view body, std::shared_ptr<const char> owner, const Message& message,
                             CodecLimits limits) noexcept
    : _owner(std::move(owner)),
      _cursor(_owner ? std::string_view(_owner.get(), body.size()) : body, message.header->isBigEndian),
      _types(message.header->signature),
      _limits(limits) {}

bool MessageReader::fail(CodecResult result) noexcept {
  if (_result == CodecResult::Ok) _result = result;
  return false;
}

/// The next argument has to be of `type`.
bool MessageReader::take(std::string_view type) noexcept {
  if (_result != CodecResult::Ok || !_types.starts_with(type)) return fail(CodecResult::WrongType);
  _types.remove_prefix(type.size());
  return true;
}

bool MessageReader::count(std::size_t content) noexcept {
  _content += content;
  return (_nodes <= _limits.nodes && _content <= _limits.content) || fail(CodecResult::LimitExceeded);
}

bool MessageReader::countNode(std::size_t content) noexcept {
  ++_nodes;
  return count(kNodeContent + content);
}

/// Left by `--_containers`; a failure ends the reading, so it need not be.
bool MessageReader::enter() noexcept {
  return ++_containers <= kMaximumContainers || fail(CodecResult::LimitExceeded);
}

/// `elements` reads up to the end that it is given.
template <class Elements>
bool MessageReader::array(std::size_t alignment, const Elements& elements) {
  std::uint32_t size = 0;
  if (!enter() || !found(_cursor.number(size) && _cursor.align(alignment) && size <= _cursor.left())) {
    return false;
  }
  const std::size_t end = _cursor.position() + size;
  if (!elements(end) || !found(_cursor.position() == end)) return false;
  --_containers;
  return true;
}

template <class T, class One>
bool MessageReader::atMostOne(std::size_t alignment, std::optional<T>& out, const One& readOne) {
  out.reset();
  return array(alignment, [&](std::size_t end) {
    if (_cursor.position() < end && !readOne(out.emplace())) return false;
    return _cursor.position() >= end || fail(CodecResult::WrongType);
  });
}

bool MessageReader::boolean(bool& out) {
  std::uint32_t value = 0;
  if (!found(_cursor.number(value) && value <= 1)) return false;
  out = value == 1;
  return true;
}

/// Valid UTF-8 without NUL; counted, but not as a node.
bool MessageReader::text(std::string_view& out) {
  return found(_cursor.text(out) && isValidUTF8(out, false)) && count(out.size());
}

Text MessageReader::kept(std::string_view text) {
  if (!_owner) return _arena.add(text);
  return Text(std::shared_ptr<const char>(_owner, text.data()), text.size());
}

// --- Arguments

bool MessageReader::read(bool& out) { return take("b") && boolean(out); }
bool MessageReader::read(std::uint16_t& out) { return take("q") && found(_cursor.number(out)); }
bool MessageReader::read(double& out) { return take("d") && found(_cursor.number(out)); }
bool MessageReader::read(std::string& out) { return take("s") && stringArgument(out); }
bool MessageReader::read(Dictionary& out) { return take("a{sv}") && dictionary("v", out); }

bool MessageReader::read(List& out) {
  const auto type = _types.substr(0, completeTypeLength(_types));
  if (!type.starts_with('a')) return fail(CodecResult::WrongType);
  return take(type) && list(type.substr(1), out);
}

bool MessageReader::read(Value& out) {
  const auto type = _types.substr(0, completeTypeLength(_types));
  if (type.empty()) return fail(CodecResult::WrongType);
  return take(type) && value(type, out);
}

bool MessageReader::read(std::optional<Dictionary>& out) {
  return take("aa{sv}") && atMostOne(4, out, [this](Dictionary& one) { return dictionary("v", one); });
}

bool MessageReader::read(std::optional<std::string>& out) {
  return take("as") && atMostOne(4, out, [this](std::string& one) { return stringArgument(one); });
}

bool MessageReader::read(std::vector<std::string>& out) { return take("as") && strings(out); }

bool MessageReader::read(std::optional<std::vector<std::string>>& out) {
  return take("aas") && atMostOne(4, out, [this](std::vector<std::string>& one) { return strings(one); });
}

bool MessageReader::readDescriptor(std::optional<std::uint32_t>& out) {
  return take("ah") &&
         atMostOne(4, out, [this](std::uint32_t& index) { return found(_cursor.number(index)); });
}

bool MessageReader::finish() {
  if (_result != CodecResult::Ok || !_types.empty()) return fail(CodecResult::WrongType);
  return found(_cursor.atEnd());
}

bool MessageReader::stringArgument(std::string& out) {
  std::string_view view;
  if (!text(view)) return false;
  out = view;
  return true;
}

bool MessageReader::strings(std::vector<std::string>& out) {
  out.clear();
  return array(4, [&](std::size_t end) {
    while (_cursor.position() < end) {
      if (!countNode() || !stringArgument(out.emplace_back())) return false;
    }
    return true;
  });
}

// --- Values

/// `type`: one complete type.
bool MessageReader::value(std::string_view type, Value& out) {
  switch (type[0]) {
    case 'v':
      return variant(out);
    case '(':
      return structure(type.substr(1, type.size() - 2), out);
    case 'a':
      break;
    default:
      return basic(type[0], out);
  }
  if (type[1] == 'y') return bytes(out);
  if (type[1] == '{' && type[2] == 's') {
    Dictionary entries;
    if (!dictionary(type.substr(3, type.size() - 4), entries)) return false;
    out = std::move(entries);
    return true;
  }
  List items;
  if (!list(type.substr(1), items)) return false;
  out = std::move(items);
  return true;
}

template <class Number, class As>
bool MessageReader::number(Value& out) {
  Number raw{};
  if (!found(_cursor.number(raw))) return false;
  out = static_cast<As>(raw);
  return true;
}

bool MessageReader::basic(char type, Value& out) {
  if (type == 'h') return fail(CodecResult::WrongType);
  if (!countNode()) return false;
  switch (type) {
    case 's': {
      std::string_view view;
      if (!text(view)) return false;
      out = kept(view);
      return true;
    }
    case 'o': {
      std::string_view path;
      if (!found(_cursor.text(path) && isObjectPath(path)) || !count(path.size())) return false;
      out = kept(path);
      return true;
    }
    case 'g': {
      std::string_view signature;
      if (!found(_cursor.signature(signature) && isValidSignature(signature)) || !count(signature.size())) {
        return false;
      }
      // The empty signature, which means nothing anywhere else, is the null marker.
      out = signature.empty() ? Value() : Value(kept(signature));
      return true;
    }
    case 'b': {
      bool flag = false;
      if (!boolean(flag)) return false;
      out = flag;
      return true;
    }
    case 'y':
      return number<std::uint8_t, std::uint64_t>(out);
    case 'n':
      return number<std::int16_t, std::int64_t>(out);
    case 'q':
      return number<std::uint16_t, std::uint64_t>(out);
    case 'i':
      return number<std::int32_t, std::int64_t>(out);
    case 'u':
      return number<std::uint32_t, std::uint64_t>(out);
    case 'x':
      return number<std::int64_t, std::int64_t>(out);
    case 't':
      return number<std::uint64_t, std::uint64_t>(out);
    default:
      return number<double, double>(out);
  }
}

bool MessageReader::variant(Value& out) {
  std::string_view type;
  if (!enter() || !found(_cursor.signature(type))) return false;
  if (!found(!type.empty() && completeTypeLength(type) == type.size()) || !value(type, out)) return false;
  --_containers;
  return true;
}

bool MessageReader::structure(std::string_view members, Value& out) {
  if (!countNode() || !enter() || !found(_cursor.align(8))) return false;
  if (members == "d") {
    Date date;
    if (!found(_cursor.number(date.secondsSince1970))) return false;
    out = date;
  } else if (!entryAsList(members, out)) {
    return false;
  }
  --_containers;
  return true;
}

/// The members of a structure, or key and value of an entry whose key is no text.
bool MessageReader::entryAsList(std::string_view types, Value& out) {
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  std::vector<Value> values;
  while (!types.empty()) {
    const std::size_t length = completeTypeLength(types);
    if (!value(types.substr(0, length), values.emplace_back())) return false;
    types.remove_prefix(length);
  }
  --_depth;
  out = List(std::move(values));
  return true;
}

bool MessageReader::bytes(Value& out) {
  return array(1, [&](std::size_t end) {
    std::string_view data;
    if (!countNode(end - _cursor.position())) return false;
    _cursor.bytes(end - _cursor.position(), data);
    out = Bytes(std::string(data));
    return true;
  });
}

bool MessageReader::dictionary(std::string_view valueType, Dictionary& out) {
  if (!countNode()) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  MutableDictionary building;
  const bool isRead = array(8, [&](std::size_t end) {
    if (_cursor.position() < end) building.reserve(8);
    while (_cursor.position() < end) {
      std::string_view key;
      Value value;
      if (!enter() || !found(_cursor.align(8)) || !text(key)) return false;
      if (!this->value(valueType, value)) return false;
      --_containers;
      building.append(kept(key), std::move(value));
    }
    return true;
  });
  if (!isRead) return false;
  --_depth;
  out = building.shareUnique();
  return true;
}

bool MessageReader::list(std::string_view elementType, List& out) {
  if (!countNode()) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  std::vector<Value> values;
  const bool isEntry = elementType[0] == '{';
  const bool isRead = array(alignmentOf(elementType[0]), [&](std::size_t end) {
    while (_cursor.position() < end) {
      Value& next = values.emplace_back();
      if (!isEntry) {
        if (!value(elementType, next)) return false;
        continue;
      }
      if (!countNode() || !enter() || !found(_cursor.align(8))) return false;
      if (!entryAsList(elementType.substr(1, elementType.size() - 2), next)) return false;
      --_containers;
    }
    return true;
  });
  if (!isRead) return false;
  --_depth;
  out = List(std::move(values));
  return true;
}

}  // namespace vesk
