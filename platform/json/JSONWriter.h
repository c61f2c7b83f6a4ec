// JSON text, written straight from values.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

enum class JSONStyle {
  Compact,  ///< no white space
  Pretty    ///< four blanks of indentation, one member a line
};

/// Writes one JSON value, top to bottom, into one buffer:
///
///     JSONWriter writer(JSONStyle::Compact, 4096);
///     writer.beginObject();
///     writer.key("events");
///     writer.value(list);
///     writer.endObject();
///     if (auto body = writer.finish()) …
///
/// What JSON can't carry makes the whole document fail, which `finish` tells; calls after that do nothing. It
/// fails on: text or a key that is not UTF-8, a double (or date) that is not finite, bytes, values nested
/// deeper than 64, and calls out of order. Callers that would rather report something for such a value
/// replace it first.
///
/// Doubles are written with as few digits as read back to the same double, so that seconds since 1970 keep
/// their microseconds. Dates are written as their seconds since 1970, the null marker as null. A key that is
/// written twice stands there twice; dictionaries have none. Not thread-safe.
class JSONWriter {
 public:
  /// `reserve`: bytes that the text is expected to need; more is allocated as needed.
  explicit JSONWriter(JSONStyle style, std::size_t reserve = 1024);
  JSONWriter(JSONWriter&&) noexcept;
  JSONWriter& operator=(JSONWriter&&) noexcept;
  ~JSONWriter();

  void beginObject();
  void endObject();
  void beginArray();
  void endArray();
  void key(std::string_view key);

  void value(const Value& value);
  void value(const Dictionary& dictionary);
  void value(const List& list);
  /// The entries as an object: for dictionaries that are still under construction.
  void value(const MutableDictionary& dictionary);

  void text(std::string_view text);
  void number(double number);

  /// The text when it is good and complete, else nothing. The writer is used up.
  std::optional<std::string> finish();

  class Impl;  // one for each style, in the source

 private:
  std::unique_ptr<Impl> _impl;
};

/// One value as JSON, under the rules above.
std::optional<std::string> toJSON(const Value& value, JSONStyle style);

}  // namespace vesk
