// Reads a message's arguments directly into the project's values. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/ipc/Codec.h"
#include "platform/ipc/Message.h"
#include "platform/ipc/Signature.h"
#include "platform/ipc/WireCursor.h"

namespace vesk {

/// Reads the arguments in order. After a failure, all further reads fail with the same error. Not
/// thread-safe.
class MessageReader {
 public:
  /// The values that are read may outlive the message.
  explicit MessageReader(const Message& message, CodecLimits limits = {});
  /// Reads values of `types` starting at `cursor`.
  MessageReader(const WireCursor& cursor, std::string_view types) noexcept : _cursor(cursor), _types(types) {}

  /// Each overload reads the next argument into `out` and returns whether all reads so far succeeded. T: an
  /// alternative of IPCArgument, read as the D-Bus type listed there.
  template <class T>
  bool read(T& out) {
    return take(argumentType<T>()) && get(out);
  }
  bool read(List& out);   ///< an array of anything
  bool read(Value& out);  ///< anything
  /// ah with at most one element: an index into the message's descriptors.
  bool readDescriptor(std::optional<std::uint32_t>& out) {
    return take(argumentType<IPCDescriptor>()) && get(out);
  }

  /// Whether all arguments have been read and no bytes are left.
  bool finish();

  CodecResult result() const noexcept { return _result; }
  const WireCursor& cursor() const noexcept { return _cursor; }

 private:
  bool fail(CodecResult result) noexcept;
  bool found(bool isWellFormed) noexcept { return isWellFormed || fail(CodecResult::Malformed); }
  bool take(std::string_view type) noexcept;
  bool count(std::size_t content) noexcept;
  bool countNode(std::size_t content = 0) noexcept;
  bool enter() noexcept;

  /// `elements` reads up to the given end.
  template <class Elements>
  bool array(std::size_t alignment, const Elements& elements) {
    std::uint32_t size = 0;
    if (!enter() || !found(_cursor.number(size) && _cursor.align(alignment) && size <= _cursor.left())) {
      return false;
    }
    const std::size_t end = _cursor.position() + size;
    if (!elements(end) || !found(_cursor.position() == end)) return false;
    --_containers;
    return true;
  }

  template <class Number>
  bool get(Number& out) {
    return found(_cursor.number(out));
  }
  bool get(bool& out);
  bool get(std::string& out);
  bool get(std::vector<std::string>& out);
  bool get(Dictionary& out) { return dictionary("v", out); }
  /// An array of at most one element: a 32-bit number, a text or an array.
  template <class T>
  bool get(std::optional<T>& out) {
    out.reset();
    return array(4, [&](std::size_t end) {
      if (_cursor.position() < end && !get(out.emplace())) return false;
      return _cursor.position() >= end || fail(CodecResult::WrongType);
    });
  }

  std::string_view nextType() const noexcept { return _types.substr(0, completeTypeLength(_types)); }
  bool text(std::string_view& out);
  Text kept(std::string_view text);

  bool value(std::string_view type, Value& out);
  bool basic(char type, Value& out);
  template <class Number, class As>
  bool number(Value& out);
  bool name(char type, Value& out);
  bool variant(Value& out);
  bool structure(std::string_view members, Value& out);
  bool bytes(Value& out);
  bool dictionary(std::string_view valueType, Dictionary& out);
  bool entryAsList(std::string_view types, Value& out);
  bool list(std::string_view elementType, List& out);

  const std::shared_ptr<const char> _owner;  // of the bytes that texts refer to; if null, texts are copied
  WireCursor _cursor;
  std::string_view _types;  // of the remaining arguments
  const CodecLimits _limits{};
  TextArena _arena;
  std::size_t _depth = 0;
  std::size_t _containers = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

}  // namespace vesk
