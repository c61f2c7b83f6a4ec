// The functions of Value.h.
#pragma once

#include <algorithm>
#include <cmath>
#include <limits>
#include <unordered_map>

#include "Value.h"

namespace vesk {

namespace detail {

inline constexpr std::size_t kLinearScanLimit = 32;

inline const Value* findIn(const std::vector<DictionaryEntry>& entries, std::string_view key) noexcept {
  for (const auto& entry : entries) {
    if (entry.key == key) return &entry.value;
  }
  return nullptr;
}

inline bool areUnique(const std::vector<DictionaryEntry>& entries) noexcept {
  for (auto entry = entries.begin(); entry != entries.end(); ++entry) {
    for (auto earlier = entries.begin(); earlier != entry; ++earlier) {
      if (earlier->key == entry->key) return false;
    }
  }
  return true;
}

/// Leaves one entry for each key, with the place of its first and the value of its last.
inline void makeUnique(std::vector<DictionaryEntry>& entries) {
  std::unordered_map<Text, std::size_t> places;
  places.reserve(entries.size());
  std::size_t count = 0;
  for (auto& entry : entries) {
    auto [at, isNew] = places.emplace(entry.key, count);
    if (!isNew) {
      entries[at->second].value = std::move(entry.value);
    } else if (auto& place = entries[count++]; &place != &entry) {
      place = std::move(entry);
    }
  }
  entries.erase(entries.begin() + static_cast<std::ptrdiff_t>(count), entries.end());
}

template <class T>
std::optional<T> heldBy(const Value* value, const T* (Value::*kind)() const noexcept) {
  const T* found = value ? (value->*kind)() : nullptr;
  return found ? std::optional(*found) : std::nullopt;
}

}  // namespace detail

// --- List

VESK_VALUES_INLINE List::List(std::vector<Value> values) {
  values.shrink_to_fit();  // lists are rarely built, and unused capacity adds up in queues
  if (!values.empty()) _values = std::make_shared<const std::vector<Value>>(std::move(values));
}

VESK_VALUES_INLINE List::List(std::initializer_list<Value> values) : List(std::vector<Value>(values)) {}

VESK_VALUES_INLINE std::size_t List::size() const noexcept { return _values ? _values->size() : 0; }
VESK_VALUES_INLINE const Value& List::operator[](std::size_t index) const noexcept {
  return (*_values)[index];
}
VESK_VALUES_INLINE const Value* List::begin() const noexcept { return _values ? _values->data() : nullptr; }
VESK_VALUES_INLINE const Value* List::end() const noexcept {
  return _values ? _values->data() + _values->size() : nullptr;
}

VESK_VALUES_INLINE bool operator==(const List& a, const List& b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end());
}

// --- Dictionary

struct Dictionary::Storage {
  explicit Storage(std::vector<DictionaryEntry> list) : entries(std::move(list)) {
    if (entries.size() <= detail::kLinearScanLimit) return;
    index.reserve(entries.size());
    for (std::size_t i = 0; i < entries.size(); ++i) index.emplace(entries[i].key.view(), i);
  }
  std::vector<DictionaryEntry> entries;
  std::unordered_map<std::string_view, std::size_t> index;  // empty for small dictionaries
};

VESK_VALUES_INLINE Dictionary::Dictionary(std::initializer_list<DictionaryEntry> entries) {
  MutableDictionary building;
  building.reserve(entries.size());
  for (const auto& entry : entries) building.append(entry.key, entry.value);
  *this = building.shareUnique();
}

VESK_VALUES_INLINE std::size_t Dictionary::size() const noexcept {
  return _storage ? _storage->entries.size() : 0;
}
VESK_VALUES_INLINE const DictionaryEntry* Dictionary::begin() const noexcept {
  return _storage ? _storage->entries.data() : nullptr;
}
VESK_VALUES_INLINE const DictionaryEntry* Dictionary::end() const noexcept { return begin() + size(); }

VESK_VALUES_INLINE const Value* Dictionary::find(std::string_view key) const noexcept {
  if (!_storage) return nullptr;
  if (_storage->index.empty()) return detail::findIn(_storage->entries, key);
  auto at = _storage->index.find(key);
  return at == _storage->index.end() ? nullptr : &_storage->entries[at->second].value;
}

VESK_VALUES_INLINE std::optional<Text> Dictionary::text(std::string_view key) const {
  return detail::heldBy(find(key), &Value::text);
}
VESK_VALUES_INLINE std::optional<Dictionary> Dictionary::dictionary(std::string_view key) const {
  return detail::heldBy(find(key), &Value::dictionary);
}
VESK_VALUES_INLINE std::optional<List> Dictionary::list(std::string_view key) const {
  return detail::heldBy(find(key), &Value::list);
}

VESK_VALUES_INLINE bool operator==(const Dictionary& a, const Dictionary& b) noexcept {
  if (a._storage == b._storage) return true;
  return std::equal(a.begin(), a.end(), b.begin(), b.end());
}

// --- MutableDictionary

VESK_VALUES_INLINE MutableDictionary::MutableDictionary(const Dictionary& source, std::size_t extra) {
  _entries.reserve(source.size() + extra);
  _entries.assign(source.begin(), source.end());
}

VESK_VALUES_INLINE void MutableDictionary::set(Text key, Value value) {
  for (auto& entry : _entries) {
    if (entry.key == key) {
      entry.value = std::move(value);
      return;
    }
  }
  append(std::move(key), std::move(value));
}

VESK_VALUES_INLINE void MutableDictionary::setAll(const Dictionary& source) {
  if (source.size() <= detail::kLinearScanLimit) {
    for (const auto& entry : source) set(entry.key, entry.value);
    return;
  }
  _entries.insert(_entries.end(), source.begin(), source.end());
  detail::makeUnique(_entries);
}

VESK_VALUES_INLINE void MutableDictionary::remove(std::string_view key) {
  const auto isNamed = [&](const DictionaryEntry& entry) { return entry.key == key; };
  _entries.erase(std::remove_if(_entries.begin(), _entries.end(), isNamed), _entries.end());
}

VESK_VALUES_INLINE const Value* MutableDictionary::find(std::string_view key) const noexcept {
  return detail::findIn(_entries, key);
}

VESK_VALUES_INLINE Dictionary MutableDictionary::share() {
  if (_entries.empty()) return {};
  return Dictionary(std::make_shared<const Dictionary::Storage>(std::exchange(_entries, {})));
}

VESK_VALUES_INLINE Dictionary MutableDictionary::shareUnique() {
  if (_entries.size() > detail::kLinearScanLimit || !detail::areUnique(_entries))
    detail::makeUnique(_entries);
  return share();
}

// --- Numbers

namespace detail {

/// What `convert` makes of a number; nullopt for any other kind of value.
template <class T, class Convert>
std::optional<T> converted(const Value& value, Convert convert) noexcept {
  return value.visit([&](const auto& number) -> std::optional<T> {
    if constexpr (std::is_arithmetic_v<std::decay_t<decltype(number)>>) return convert(number);
    return std::nullopt;
  });
}

inline std::int64_t clamped(double number) noexcept {
  if (std::isnan(number)) return 0;
  if (number >= 0x1p63) return std::numeric_limits<std::int64_t>::max();
  if (number < -0x1p63) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(number);
}

}  // namespace detail

VESK_VALUES_INLINE std::optional<std::int64_t> Value::asInteger() const noexcept {
  return detail::converted<std::int64_t>(*this, [](auto number) {
    if constexpr (std::is_floating_point_v<decltype(number)>) return detail::clamped(number);
    return static_cast<std::int64_t>(number);
  });
}

VESK_VALUES_INLINE std::optional<double> Value::asDouble() const noexcept {
  return detail::converted<double>(*this, [](auto number) { return static_cast<double>(number); });
}

VESK_VALUES_INLINE std::optional<bool> Value::asBoolean() const noexcept {
  return detail::converted<bool>(*this, [](auto number) { return number != 0; });
}

VESK_VALUES_INLINE std::optional<std::int64_t> integerForKey(const Dictionary& dictionary,
                                                             std::string_view key) noexcept {
  const Value* value = dictionary.find(key);
  return value ? value->asInteger() : std::nullopt;
}

VESK_VALUES_INLINE std::optional<double> doubleForKey(const Dictionary& dictionary,
                                                      std::string_view key) noexcept {
  const Value* value = dictionary.find(key);
  return value ? value->asDouble() : std::nullopt;
}

VESK_VALUES_INLINE std::optional<bool> booleanForKey(const Dictionary& dictionary,
                                                     std::string_view key) noexcept {
  const Value* value = dictionary.find(key);
  return value ? value->asBoolean() : std::nullopt;
}

namespace detail {

// Approximate cost of an allocation with its reference count, and of an index node.
inline constexpr std::size_t kBlockMemory = 32;
inline constexpr std::size_t kIndexNodeMemory = 48;

inline std::size_t memoryOf(const std::vector<DictionaryEntry>& entries) noexcept {
  std::size_t size = entries.capacity() * sizeof(DictionaryEntry);
  for (const auto& entry : entries) size += entry.key.size() + approximateMemory(entry.value);
  return size;
}

}  // namespace detail

VESK_VALUES_INLINE std::size_t approximateMemory(const Value& value) noexcept {
  if (const Text* text = value.text()) return text->size();
  if (const Bytes* bytes = value.bytes()) return bytes->size();
  if (const Dictionary* dictionary = value.dictionary()) return approximateMemory(*dictionary);
  std::size_t size = 0;
  if (const List* list = value.list(); list && !list->empty()) {
    size = sizeof(std::vector<Value>) + 2 * detail::kBlockMemory;
    for (const Value& item : *list) size += sizeof(Value) + approximateMemory(item);
  }
  return size;
}

VESK_VALUES_INLINE std::size_t approximateMemory(const Dictionary& dictionary) noexcept {
  if (!dictionary._storage) return 0;
  const auto& storage = *dictionary._storage;
  return sizeof storage + 2 * detail::kBlockMemory + detail::memoryOf(storage.entries) +
         storage.index.size() * (sizeof(*storage.index.begin()) + detail::kIndexNodeMemory);
}

VESK_VALUES_INLINE std::size_t approximateMemory(const MutableDictionary& dictionary) noexcept {
  return detail::memoryOf(dictionary.entries());
}

}  // namespace vesk
