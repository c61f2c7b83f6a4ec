// The arguments of a message, from its bytes straight to the project's values. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ipc/Codec.h"
#include "platform/ipc/Message.h"
#include "platform/ipc/WireCursor.h"
#include "platform/values/Value.h"

namespace vesk {

/// Whether `path` is a D-Bus object path.
bool isObjectPath(std::string_view path) noexcept;

/// Reads the arguments from first to last. After the first failure every further read fails the same way.
/// For one thread.
class MessageReader {
 public:
  /// The values that are read may outlive the message.
  explicit MessageReader(const Message& message, CodecLimits limits = {});
  /// Reads values of `types` from `cursor` on.
  MessageReader(const WireCursor& cursor, std::string_view types) noexcept : _cursor(cursor), _types(types) {}

  /// Each reads the next argument into `out` and returns whether everything was well so far.
  bool read(bool& out);
  bool read(std::uint16_t& out);
  bool read(double& out);
  bool read(std::string& out);
  bool read(Dictionary& out);                               ///< a{sv}
  bool read(List& out);                                     ///< an array of anything
  bool read(Value& out);                                    ///< anything
  bool read(std::optional<Dictionary>& out);                ///< aa{sv}, at most one
  bool read(std::optional<std::string>& out);               ///< as, at most one
  bool read(std::vector<std::string>& out);                 ///< as
  bool read(std::optional<std::vector<std::string>>& out);  ///< aas, at most one
  /// ah, at most one: an index into the message's descriptors.
  bool readDescriptor(std::optional<std::uint32_t>& out);

  /// Whether all arguments have been read and no byte is left.
  bool finish();

  CodecResult result() const noexcept { return _result; }
  const WireCursor& cursor() const noexcept { return _cursor; }

 private:
  MessageReader(std::string_view body, std::shared_ptr<const char> owner, const Message& message,
                CodecLimits limits) noexcept;

  bool fail(CodecResult result) noexcept;
  bool found(bool isWellFormed) noexcept { return isWellFormed || fail(CodecResult::Malformed); }
  bool take(std::string_view type) noexcept;
  bool count(std::size_t content) noexcept;
  bool countNode(std::size_t content = 0) noexcept;
  bool enter() noexcept;

  template <class Elements>
  bool array(std::size_t alignment, const Elements& elements);
  template <class T, class One>
  bool atMostOne(std::size_t alignment, std::optional<T>& out, const One& readOne);
  template <class Number, class As>
  bool number(Value& out);
  bool boolean(bool& out);
  bool stringArgument(std::string& out);
  bool strings(std::vector<std::string>& out);
  bool text(std::string_view& out);
  Text kept(std::string_view text);

  bool value(std::string_view type, Value& out);
  bool basic(char type, Value& out);
  bool variant(Value& out);
  bool structure(std::string_view members, Value& out);
  bool bytes(Value& out);
  bool dictionary(std::string_view valueType, Dictionary& out);
  bool entryAsList(std::string_view types, Value& out);
  bool list(std::string_view elementType, List& out);

  const std::shared_ptr<const char>
      _owner;  // of the bytes that texts point into; without one they are copied
  WireCursor _cursor;
  std::string_view _types;  // of the arguments that are left
  const CodecLimits _limits{};
  TextArena _arena;
  std::size_t _depth = 0;
  std::size_t _containers = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

}  // namespace vesk
