// The dynamic values in messages, session infos, preferences and configurations.
#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "Text.h"

namespace vesk {

class Value;
struct DictionaryEntry;
class MutableDictionary;

/// A point in time in seconds since 1970. Input from outside may make it fractional, negative or not finite.
struct Date {
  double secondsSince1970 = 0;
  friend bool operator==(Date a, Date b) noexcept { return a.secondsSince1970 == b.secondsSince1970; }
};

/// Immutable bytes, shared between copies.
class Bytes {
 public:
  Bytes() noexcept = default;
  explicit Bytes(std::string data) : _data(std::make_shared<const std::string>(std::move(data))) {}
  std::string_view view() const noexcept { return _data ? std::string_view(*_data) : std::string_view(); }
  std::size_t size() const noexcept { return view().size(); }
  friend bool operator==(const Bytes& a, const Bytes& b) noexcept { return a.view() == b.view(); }

 private:
  std::shared_ptr<const std::string> _data;
};

/// Immutable sequence of values, shared between copies.
class List {
 public:
  List() noexcept = default;
  explicit List(std::vector<Value> values);
  List(std::initializer_list<Value> values);

  std::size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  const Value& operator[](std::size_t index) const noexcept;
  const Value* begin() const noexcept;
  const Value* end() const noexcept;
  friend bool operator==(const List& a, const List& b) noexcept;

 private:
  std::shared_ptr<const std::vector<Value>> _values;
};

/// Immutable map from text to value that keeps the order of insertion. Keys are unique. Copies share their
/// entries. Lookup scans up to 32 entries, which is faster than hashing at the size of a message, and uses an
/// index above that.
class Dictionary {
 public:
  Dictionary() noexcept = default;
  Dictionary(std::initializer_list<DictionaryEntry> entries);

  std::size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  const DictionaryEntry* begin() const noexcept;
  const DictionaryEntry* end() const noexcept;

  /// The value under `key`, or null. It lives as long as any copy of this dictionary.
  const Value* find(std::string_view key) const noexcept;
  bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }

  /// The value under `key` if it has that kind, otherwise nullopt.
  std::optional<Text> text(std::string_view key) const;
  std::optional<Dictionary> dictionary(std::string_view key) const;
  std::optional<List> list(std::string_view key) const;

  friend bool operator==(const Dictionary& a, const Dictionary& b) noexcept;
  friend std::size_t approximateMemory(const Dictionary& dictionary) noexcept;

 private:
  friend class MutableDictionary;
  struct Storage;
  explicit Dictionary(std::shared_ptr<const Storage> storage) noexcept : _storage(std::move(storage)) {}
  std::shared_ptr<const Storage> _storage;
};

/// One value of any kind. A default-constructed value is the null marker.
class Value {
 public:
  /// In the order of the variant's alternatives.
  enum class Kind : std::uint8_t {
    None,
    Boolean,
    Signed,
    Unsigned,
    Double,
    Text,
    Bytes,
    Date,
    List,
    Dictionary
  };

  Value() noexcept = default;
  Value(bool value) noexcept : _value(value) {}                                            // NOLINT
  Value(int value) noexcept : _value(static_cast<std::int64_t>(value)) {}                  // NOLINT
  Value(long value) noexcept : _value(static_cast<std::int64_t>(value)) {}                 // NOLINT
  Value(long long value) noexcept : _value(static_cast<std::int64_t>(value)) {}            // NOLINT
  Value(unsigned value) noexcept : _value(static_cast<std::uint64_t>(value)) {}            // NOLINT
  Value(unsigned long value) noexcept : _value(static_cast<std::uint64_t>(value)) {}       // NOLINT
  Value(unsigned long long value) noexcept : _value(static_cast<std::uint64_t>(value)) {}  // NOLINT
  Value(double value) noexcept : _value(value) {}                                          // NOLINT
  Value(vesk::Text value) noexcept : _value(std::move(value)) {}                           // NOLINT
  Value(std::string_view value) : _value(vesk::Text(value)) {}                             // NOLINT
  Value(const std::string& value) : _value(vesk::Text(value)) {}                           // NOLINT
  Value(vesk::Bytes value) noexcept : _value(std::move(value)) {}                          // NOLINT
  Value(vesk::Date value) noexcept : _value(value) {}                                      // NOLINT
  Value(vesk::List value) noexcept : _value(std::move(value)) {}                           // NOLINT
  Value(vesk::Dictionary value) noexcept : _value(std::move(value)) {}                     // NOLINT
  /// A null pointer, which `std::getenv` may return, gives the null marker.
  Value(const char* value) : Value(value ? Value(vesk::Text(value)) : Value()) {}  // NOLINT
  Value(std::nullptr_t) noexcept {}                                                // NOLINT
  Value(const void* pointer) = delete;  // otherwise any pointer would convert to a boolean

  Kind kind() const noexcept { return static_cast<Kind>(_value.index()); }
  bool isNone() const noexcept { return kind() == Kind::None; }
  /// Boolean, integer or double.
  bool isNumber() const noexcept { return kind() >= Kind::Boolean && kind() <= Kind::Double; }

  /// The value if it has that kind, otherwise null.
  const bool* boolean() const noexcept { return std::get_if<bool>(&_value); }
  const std::int64_t* signedInteger() const noexcept { return std::get_if<std::int64_t>(&_value); }
  const std::uint64_t* unsignedInteger() const noexcept { return std::get_if<std::uint64_t>(&_value); }
  const double* real() const noexcept { return std::get_if<double>(&_value); }
  const vesk::Text* text() const noexcept { return std::get_if<vesk::Text>(&_value); }
  const vesk::Bytes* bytes() const noexcept { return std::get_if<vesk::Bytes>(&_value); }
  const vesk::Date* date() const noexcept { return std::get_if<vesk::Date>(&_value); }
  const vesk::List* list() const noexcept { return std::get_if<vesk::List>(&_value); }
  const vesk::Dictionary* dictionary() const noexcept { return std::get_if<vesk::Dictionary>(&_value); }

  /// Converts between number types; nullopt if the value is not a number. Integers wrap like an integer
  /// conversion. Doubles are truncated and first clamped to the 64-bit range, so that no input gives an
  /// undefined result (NaN gives 0).
  std::optional<std::int64_t> asInteger() const noexcept;
  std::optional<double> asDouble() const noexcept;
  std::optional<bool> asBoolean() const noexcept;

  friend bool operator==(const Value& a, const Value& b) noexcept { return a._value == b._value; }

  /// Makes this a `T`, one of the alternatives, in place.
  template <class T, class... Arguments>
  T& emplace(Arguments&&... arguments) {
    return _value.template emplace<T>(std::forward<Arguments>(arguments)...);
  }

  template <class Visitor>
  decltype(auto) visit(Visitor&& visitor) const {
    return std::visit(std::forward<Visitor>(visitor), _value);
  }

 private:
  std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, vesk::Text, vesk::Bytes, vesk::Date,
               vesk::List, vesk::Dictionary>
      _value;
};

struct DictionaryEntry {
  Text key;
  Value value;
  friend bool operator==(const DictionaryEntry& a, const DictionaryEntry& b) noexcept {
    return a.key == b.key && a.value == b.value;
  }
};

/// A dictionary under construction. Not thread-safe.
class MutableDictionary {
 public:
  MutableDictionary() noexcept = default;
  /// Starts as a copy of `source`, with room for `extra` more entries.
  explicit MutableDictionary(const Dictionary& source, std::size_t extra = 0);

  void reserve(std::size_t entries) { _entries.reserve(entries); }
  std::size_t size() const noexcept { return _entries.size(); }
  bool empty() const noexcept { return _entries.empty(); }

  /// Replaces the value under `key` in place, or appends an entry.
  void set(Text key, Value value);
  /// Sets every entry of `source`.
  void setAll(const Dictionary& source);
  /// Appends an entry. `key` must not be present yet; this is not checked.
  void append(Text key, Value value) { _entries.push_back({std::move(key), std::move(value)}); }
  void remove(std::string_view key);

  const Value* find(std::string_view key) const noexcept;
  bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }

  std::vector<DictionaryEntry>& entries() noexcept { return _entries; }
  const std::vector<DictionaryEntry>& entries() const noexcept { return _entries; }

  /// Moves the entries into an immutable dictionary and leaves this one empty.
  Dictionary share();
  /// Like `share`, for entries that may repeat a key: the last value wins, at the position of the first.
  Dictionary shareUnique();

 private:
  std::vector<DictionaryEntry> _entries;
};

/// The value under `key`, converted to a number; nullopt if it is absent or not a number.
std::optional<std::int64_t> integerForKey(const Dictionary& dictionary, std::string_view key) noexcept;
std::optional<double> doubleForKey(const Dictionary& dictionary, std::string_view key) noexcept;
std::optional<bool> booleanForKey(const Dictionary& dictionary, std::string_view key) noexcept;

/// One line that shows a value in logs and tools, cut at about `limit` bytes.
std::string describe(const Value& value, std::size_t limit = 1024);

/// Approximate memory in bytes that a value's or dictionary's contents use beyond its own size. Text shared
/// with other dictionaries counts in full.
std::size_t approximateMemory(const Value& value) noexcept;
std::size_t approximateMemory(const Dictionary& dictionary) noexcept;
std::size_t approximateMemory(const MutableDictionary& dictionary) noexcept;

}  // namespace vesk

#ifndef VESK_VALUES_COMPILED
#include "Describe-inl.h"
#include "Value-inl.h"
#endif
