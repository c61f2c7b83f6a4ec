#include "platform/ipc/MessageReader.h"

#include <cstring>

#include "platform/ipc/Signature.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

// Texts of a body up to this size share one copy of it. The limit must be small, because one short text keeps
// the whole copy alive.
constexpr std::size_t kMaximumShared = 1024;

std::shared_ptr<const char> sharedCopy(std::string_view body) {
  if (body.empty() || body.size() > kMaximumShared) return nullptr;
  auto copy = std::make_shared_for_overwrite<char[]>(body.size());
  std::memcpy(copy.get(), body.data(), body.size());
  return std::shared_ptr<const char>(copy, copy.get());
}

}  // namespace

MessageReader::MessageReader(const Message& message, CodecLimits limits)
    : _owner(sharedCopy(message.body)),
      _cursor(_owner ? std::string_view(_owner.get(), message.body.size()) : message.body,
              message.header->isBigEndian),
      _types(message.header->signature),
      _limits(limits) {}

bool MessageReader::fail(CodecResult result) noexcept {
  if (_result == CodecResult::Ok) _result = result;
  return false;
}

/// The next argument must be of `type`.
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

/// Callers leave with `--_containers`. After a failure they need not, since it ends the reading.
bool MessageReader::enter() noexcept {
  return ++_containers <= kMaximumContainers || fail(CodecResult::LimitExceeded);
}

/// Reads valid UTF-8 without NUL. Counts its bytes, but not as a node.
bool MessageReader::text(std::string_view& out) {
  return found(_cursor.text(out) && isValidUTF8(out, false)) && count(out.size());
}

Text MessageReader::kept(std::string_view text) {
  if (!_owner) return _arena.add(text);
  return Text(std::shared_ptr<const char>(_owner, text.data()), text.size());
}

// --- Arguments

bool MessageReader::read(List& out) {
  const auto type = nextType();
  if (!type.starts_with('a')) return fail(CodecResult::WrongType);
  return take(type) && list(type.substr(1), out);
}

bool MessageReader::read(Value& out) {
  const auto type = nextType();
  if (type.empty()) return fail(CodecResult::WrongType);
  return take(type) && value(type, out);
}

bool MessageReader::finish() {
  if (_result != CodecResult::Ok || !_types.empty()) return fail(CodecResult::WrongType);
  return found(_cursor.atEnd());
}

bool MessageReader::get(bool& out) {
  std::uint32_t value = 0;
  if (!get(value) || !found(value <= 1)) return false;
  out = value == 1;
  return true;
}

bool MessageReader::get(std::string& out) {
  std::string_view view;
  if (!text(view)) return false;
  out = view;
  return true;
}

bool MessageReader::get(std::vector<std::string>& out) {
  out.clear();
  return array(4, [&](std::size_t end) {
    while (_cursor.position() < end) {
      if (!countNode() || !get(out.emplace_back())) return false;
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
    return dictionary(type.substr(3, type.size() - 4), out.emplace<Dictionary>());
  }
  return list(type.substr(1), out.emplace<List>());
}

template <class Number, class As>
bool MessageReader::number(Value& out) {
  Number raw{};
  if (!get(raw)) return false;
  out.emplace<As>(raw);
  return true;
}

bool MessageReader::basic(char type, Value& out) {
  if (type == 'h') return fail(CodecResult::WrongType);
  if (!countNode()) return false;
  switch (type) {
    case 's': {
      std::string_view view;
      if (!text(view)) return false;
      out.emplace<Text>(kept(view));
      return true;
    }
    case 'o':
    case 'g':
      return name(type, out);
    case 'b':
      return number<bool, bool>(out);
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

/// Reads an object path or a signature.
bool MessageReader::name(char type, Value& out) {
  std::string_view view;
  const bool isWellFormed = type == 'g' ? _cursor.signature(view) && isValidSignature(view)
                                        : _cursor.text(view) && isObjectPath(view);
  if (!found(isWellFormed) || !count(view.size())) return false;
  // The empty signature has no other use, so it represents the null marker.
  out = type == 'g' && view.empty() ? Value() : Value(kept(view));
  return true;
}

bool MessageReader::variant(Value& out) {
  std::string_view type;
  if (!enter() || !found(_cursor.signature(type))) return false;
  // Most values are basic, and skip the rest of the grammar.
  const bool isBasic = type.size() == 1 && isBasicType(type[0]);
  if (!isBasic && !found(!type.empty() && completeTypeLength(type) == type.size())) return false;
  if (!(isBasic ? basic(type[0], out) : value(type, out))) return false;
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

/// Reads the members of a structure, or the key and value of an entry whose key is not a text.
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
    out.emplace<Bytes>(std::string(data));
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
      if (!enter() || !found(_cursor.align(8)) || !text(key)) return false;
      DictionaryEntry& entry = building.entries().emplace_back();
      entry.key = kept(key);
      if (!value(valueType, entry.value)) return false;
      --_containers;
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
