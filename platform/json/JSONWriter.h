// Writes JSON text directly from values.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

enum class JSONStyle {
  Compact,  ///< no white space
  Pretty    ///< one member per line, indented by four blanks per level
};

/// Writes one JSON value, in document order, into one buffer:
///
///     JSONWriter writer(JSONStyle::Compact, 4096);
///     writer.beginObject();
///     writer.key("events");
///     writer.value(list);
///     writer.endObject();
///     if (auto body = writer.finish()) …
///
/// If a value can't be represented in JSON, `finish` returns nullopt for the whole document. This applies to
/// text or keys that are not UTF-8, doubles and dates that are not finite, bytes, and values nested deeper
/// than 64. Callers that prefer a substitute for such a value must replace it first.
///
/// Doubles are written with as few digits as read back to the same double, so that seconds since 1970 keep
/// their microseconds. Dates are written as seconds since 1970, the null marker as null. The caller must pair
/// begin and end and give each key one value. Not thread-safe.
class JSONWriter {
 public:
  /// `reserve`: expected size of the text in bytes; more is allocated as needed.
  explicit JSONWriter(JSONStyle style, std::size_t reserve = 1024);

  void beginObject() { open('{'); }
  void endObject() { close('}'); }
  void beginArray() { open('['); }
  void endArray() { close(']'); }
  void key(std::string_view key);

  void value(const Value& value);
  /// The entries as an object, for dictionaries still under construction.
  void value(const MutableDictionary& dictionary);

  /// Returns the text if all of it could be written. The writer must not be used afterwards.
  std::optional<std::string> finish();

 private:
  bool open(char bracket);
  void close(char bracket);
  void separate();
  void breakLine();
  void quote(std::string_view text);
  void real(double number);
  void object(const DictionaryEntry* begin, const DictionaryEntry* end);

  const bool _isPretty;
  std::string _text;
  std::size_t _depth = 0;
  bool _isFirst = true;    ///< in its object or array
  bool _isMember = false;  ///< its key was written
  bool _isGood = true;
};

/// One value as JSON, under the rules above.
std::optional<std::string> toJSON(const Value& value, JSONStyle style);

}  // namespace vesk
