// Conversions between values and their C views.
#pragma once

#include <VeskReporting/VeskValues.h>

#include <array>
#include <cstddef>
#include <optional>
#include <string_view>
#include <vector>

#include "Value.h"

namespace vesk {

/// The C view of a dictionary or list. Refers to its texts and bytes, so it must outlive the view. Needs no
/// memory from the heap for a message of usual size.
class ValueViews {
 public:
  explicit ValueViews(const Dictionary& dictionary) {
    reserve(dictionary);
    _dictionary = viewOf(dictionary);
  }
  explicit ValueViews(const List& list) {
    reserve(list);
    _list = viewOf(list);
  }
  ValueViews(const ValueViews&) = delete;
  ValueViews& operator=(const ValueViews&) = delete;

  const VeskDictionaryView& dictionary() const noexcept { return _dictionary; }
  const VeskListView& list() const noexcept { return _list; }

 private:
  static VeskTextView textView(std::string_view text) noexcept { return {text.data(), text.size()}; }

  // All nodes are counted first, so that nothing moves while views refer to it.
  void count(const Dictionary& dictionary) noexcept {
    _entryCount += dictionary.size();
    for (const DictionaryEntry& entry : dictionary) count(entry.value);
  }
  void count(const List& list) noexcept {
    _valueCount += list.size();
    for (const Value& value : list) count(value);
  }
  void count(const Value& value) noexcept {
    if (const Dictionary* dictionary = value.dictionary()) count(*dictionary);
    if (const List* list = value.list()) count(*list);
  }
  template <class Container>
  void reserve(const Container& container) {
    count(container);
    if (_entryCount > _fewEntries.size()) _manyEntries.resize(_entryCount);
    _nextEntry = _manyEntries.empty() ? _fewEntries.data() : _manyEntries.data();
    _values.resize(_valueCount);
    _nextValue = _values.data();
  }

  VeskDictionaryView viewOf(const Dictionary& dictionary) noexcept {
    VeskEntryView* entries = _nextEntry;
    _nextEntry += dictionary.size();
    VeskEntryView* next = entries;
    for (const DictionaryEntry& entry : dictionary) {
      next->key = textView(entry.key.view());
      fill(next->value, entry.value);
      ++next;
    }
    return {entries, dictionary.size()};
  }
  VeskListView viewOf(const List& list) noexcept {
    VeskValueView* values = _nextValue;
    _nextValue += list.size();
    VeskValueView* next = values;
    for (const Value& value : list) fill(*next++, value);
    return {values, list.size()};
  }
  void fill(VeskValueView& view, const Value& value) noexcept {
    view.kind = static_cast<std::uint32_t>(value.kind());
    switch (value.kind()) {
      case Value::Kind::None:
        break;
      case Value::Kind::Boolean:
        view.as.boolean = *value.boolean() ? 1 : 0;
        break;
      case Value::Kind::Signed:
        view.as.signedInteger = *value.signedInteger();
        break;
      case Value::Kind::Unsigned:
        view.as.unsignedInteger = *value.unsignedInteger();
        break;
      case Value::Kind::Double:
        view.as.real = *value.real();
        break;
      case Value::Kind::Text:
        view.as.text = textView(value.text()->view());
        break;
      case Value::Kind::Bytes:
        view.as.bytes = textView(value.bytes()->view());
        break;
      case Value::Kind::Date:
        view.as.secondsSince1970 = value.date()->secondsSince1970;
        break;
      case Value::Kind::List:
        view.as.list = viewOf(*value.list());
        break;
      case Value::Kind::Dictionary:
        view.as.dictionary = viewOf(*value.dictionary());
        break;
    }
  }

  std::size_t _entryCount = 0;
  std::size_t _valueCount = 0;
  std::array<VeskEntryView, 24> _fewEntries;
  std::vector<VeskEntryView> _manyEntries;
  std::vector<VeskValueView> _values;
  VeskEntryView* _nextEntry = nullptr;
  VeskValueView* _nextValue = nullptr;
  VeskDictionaryView _dictionary{};
  VeskListView _list{};
};

static_assert(static_cast<int>(Value::Kind::None) == VeskValueNone &&
              static_cast<int>(Value::Kind::Dictionary) == VeskValueDictionary);

namespace detail {

inline constexpr int kDeepestView = 64;

inline std::string_view textOf(VeskTextView text) noexcept {
  return text.data ? std::string_view(text.data, text.length) : std::string_view();
}

std::optional<Dictionary> copyNested(VeskDictionaryView view, int depth);
std::optional<List> copyNested(VeskListView view, int depth);

inline std::optional<Value> copyNested(const VeskValueView& view, int depth) {
  switch (view.kind) {
    case VeskValueNone:
      return Value();
    case VeskValueBoolean:
      return Value(view.as.boolean != 0);
    case VeskValueSigned:
      return Value(view.as.signedInteger);
    case VeskValueUnsigned:
      return Value(view.as.unsignedInteger);
    case VeskValueDouble:
      return Value(view.as.real);
    case VeskValueText:
      return Value(textOf(view.as.text));
    case VeskValueBytes:
      return Value(Bytes(std::string(textOf(view.as.bytes))));
    case VeskValueDate:
      return Value(Date{view.as.secondsSince1970});
    case VeskValueList:
      return copyNested(view.as.list, depth + 1);
    case VeskValueDictionary:
      return copyNested(view.as.dictionary, depth + 1);
    default:
      return std::nullopt;
  }
}

inline std::optional<Dictionary> copyNested(VeskDictionaryView view, int depth) {
  if (depth > kDeepestView) return std::nullopt;
  MutableDictionary copy;
  copy.reserve(view.count);
  for (std::size_t i = 0; i < view.count; ++i) {
    auto value = copyNested(view.entries[i].value, depth);
    if (!value) return std::nullopt;
    copy.append(textOf(view.entries[i].key), std::move(*value));
  }
  return copy.shareUnique();
}

inline std::optional<List> copyNested(VeskListView view, int depth) {
  if (depth > kDeepestView) return std::nullopt;
  std::vector<Value> copy;
  copy.reserve(view.count);
  for (std::size_t i = 0; i < view.count; ++i) {
    auto value = copyNested(view.values[i], depth);
    if (!value) return std::nullopt;
    copy.push_back(std::move(*value));
  }
  return List(std::move(copy));
}

}  // namespace detail

/// Copies what a view shows; nullopt if it is nested deeper than 64 levels or has a value of unknown kind.
inline std::optional<Dictionary> copyOf(VeskDictionaryView view) { return detail::copyNested(view, 1); }
inline std::optional<List> copyOf(VeskListView view) { return detail::copyNested(view, 1); }

}  // namespace vesk
