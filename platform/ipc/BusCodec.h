// Values on the wire: D-Bus variants, dictionaries and lists to and from the project's values.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/ipc/IPCConnection.h"
#include "platform/values/Value.h"

struct sd_bus_message;

namespace vesk {

/// What one message may hold; counted over all of its arguments while they are read or written, before
/// anything is allocated for what would exceed it.
struct CodecLimits {
  std::size_t depth = 64;                      ///< lists and dictionaries inside one another
  std::size_t nodes = 100'000;                 ///< values, each list and dictionary included
  std::size_t content = std::size_t{1} << 20;  ///< bytes of texts and byte strings, plus 8 for each node
};

enum class CodecResult {
  Ok,
  WrongType,      ///< the arguments are not of the types asked for, or hold a type that no value has
  LimitExceeded,  ///< too deep, too many values or too large
  Malformed,      ///< bytes that are no D-Bus message, or text that is not UTF-8 or holds a NUL
  OutOfResources  ///< no memory or no descriptor was left to write them with
};

const char* describe(CodecResult result) noexcept;

/// Reads the arguments of one message from first to last. After the first failure every further call fails
/// the same way. Borrows the message; for one thread.
class BusDecoder {
 public:
  explicit BusDecoder(sd_bus_message* message, CodecLimits limits = {}) noexcept
      : _message(message), _limits(limits) {}

  /// Each reads the next argument into `out` and returns `ok()`.
  bool read(bool& out);
  bool read(std::uint16_t& out);
  bool read(double& out);
  bool read(std::string& out);
  bool read(Dictionary& out);                               ///< array of entries with text keys
  bool read(List& out);                                     ///< array of anything
  bool read(Value& out);                                    ///< anything
  bool read(std::optional<Dictionary>& out);                ///< array of at most one
  bool read(std::optional<std::string>& out);               ///< array of at most one
  bool read(std::vector<std::string>& out);                 ///< array of texts
  bool read(std::optional<std::vector<std::string>>& out);  ///< array of at most one
  /// Array of at most one descriptor, which stays the message's; -1 for none.
  bool readDescriptor(int& out);

  bool ok() const noexcept { return _result == CodecResult::Ok; }
  CodecResult result() const noexcept { return _result; }

 private:
  template <class Basic>
  bool basic(char type, Basic& out);
  template <class T>
  bool optional(std::optional<T>& out, const char* contents);
  bool enter(char type, const char* contents);
  bool exit();
  bool textView(char type, std::string_view& out);
  bool next(Value& out, bool& found);
  bool value(char type, const char* contents, Value& out);
  bool variant(Value& out);
  bool number(char type, Value& out);
  bool bytes(Value& out);
  bool dictionary(const char* contents, Dictionary& out);
  bool items(char container, const char* contents, List& out);
  bool structure(const char* contents, Value& out);
  bool count(std::size_t content);
  bool fail(CodecResult result) noexcept;
  bool failWith(int error) noexcept;

  sd_bus_message* _message;
  const CodecLimits _limits;
  TextArena _arena;
  std::size_t _depth = 0;
  std::size_t _containers = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

/// Appends arguments to one message that is being built. After a failure the message is of no use. Borrows
/// the message; for one thread.
class BusEncoder {
 public:
  explicit BusEncoder(sd_bus_message* message, CodecLimits limits = {}) noexcept
      : _message(message), _limits(limits) {}

  bool append(const std::vector<IPCArgument>& arguments);
  bool append(bool value);
  bool append(std::uint16_t value);
  bool append(double value);
  bool append(std::string_view value);
  bool append(const std::string& value) { return append(std::string_view(value)); }
  bool append(const Dictionary& value);
  bool append(const List& value);
  bool append(const std::optional<Dictionary>& value);
  bool append(const std::optional<std::string>& value);
  bool append(const std::vector<std::string>& value);
  bool append(const std::optional<std::vector<std::string>>& value);
  /// As a variant.
  bool append(const Value& value);
  /// The message duplicates the descriptor.
  bool append(IPCDescriptor value);

  bool ok() const noexcept { return _result == CodecResult::Ok; }
  CodecResult result() const noexcept { return _result; }
  /// Bytes appended so far, as the limits count them.
  std::size_t content() const noexcept { return _content; }

 private:
  template <class T>
  bool optional(const std::optional<T>& value, const char* contents);
  bool open(char type, const char* contents);
  bool close();
  bool basic(char type, const void* value);
  bool variant(const char* contents, char type, const void* value);
  bool count(std::size_t content);
  bool fail(CodecResult result) noexcept;
  bool failWith(int error) noexcept;

  sd_bus_message* _message;
  const CodecLimits _limits;
  std::size_t _depth = 0;
  std::size_t _nodes = 0;
  std::size_t _content = 0;
  CodecResult _result = CodecResult::Ok;
};

}  // namespace vesk
