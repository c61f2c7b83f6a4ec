#include "tools/storebag/StorebagText.h"

#include <cmath>
#include <ctime>
#include <sstream>
#include <stdexcept>

#include "platform/crypto/Base64.h"
#include "platform/json/JSONWriter.h"
#include "platform/preferences/TomlLibrary.h"

namespace vesk {

namespace {

/// The value, with text in place of everything that JSON can't represent.
Value readable(const Value& value) {
  if (const Bytes* bytes = value.bytes()) return base64Encode(bytes->view());
  if (const double* real = value.real(); real != nullptr && !std::isfinite(*real)) return describe(value);
  if (const List* list = value.list()) {
    std::vector<Value> items;
    for (const Value& item : *list) items.push_back(readable(item));
    return List(std::move(items));
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    MutableDictionary entries;
    for (const auto& [key, entry] : *dictionary) entries.append(key, readable(entry));
    return entries.share();
  }
  return value;
}

/// Truncates to whole seconds, as in a property list.
toml::date_time dateTimeFrom(const Date& date) {
  constexpr double kLastSecond = 253402300799;  // of the year 9999
  double seconds = std::floor(date.secondsSince1970);
  if (!(seconds >= 0 && seconds <= kLastSecond)) throw std::runtime_error("a date before 1970 or after 9999");
  const auto time = static_cast<std::time_t>(seconds);
  std::tm calendar{};
  ::gmtime_r(&time, &calendar);
  return toml::date_time(toml::date(calendar.tm_year + 1900, calendar.tm_mon + 1, calendar.tm_mday),
                         toml::time(calendar.tm_hour, calendar.tm_min, calendar.tm_sec), toml::time_offset());
}

/// Where to put a value: under a key of a table, or at the end of an array.
struct Place {
  toml::table* table = nullptr;
  std::string_view key{};
  toml::array* array = nullptr;

  template <class T>
  void put(T&& form) const {
    table != nullptr ? void(table->insert(key, std::forward<T>(form)))
                     : array->push_back(std::forward<T>(form));
  }
};

void putTOML(const Value& value, const Place& place);

toml::table tableFrom(const Dictionary& dictionary) {
  toml::table table;
  for (const auto& [key, value] : dictionary) putTOML(value, {&table, key.view()});
  return table;
}

toml::array arrayFrom(const List& list) {
  toml::array array;
  for (const Value& item : list) putTOML(item, {.array = &array});
  return array;
}

void putTOML(const Value& value, const Place& place) {
  if (const bool* boolean = value.boolean()) return place.put(*boolean);
  if (const double* real = value.real()) return place.put(*real);
  if (const Text* text = value.text()) return place.put(text->string());
  if (const Bytes* bytes = value.bytes()) return place.put(base64Encode(bytes->view()));
  if (const Date* date = value.date()) return place.put(dateTimeFrom(*date));
  if (const Dictionary* dictionary = value.dictionary()) return place.put(tableFrom(*dictionary));
  if (const List* list = value.list()) return place.put(arrayFrom(*list));
  if (auto number = value.asInteger()) place.put(*number);
}

}  // namespace

std::string storebagAsJSON(const Dictionary& payload) {
  auto text = toJSON(readable(payload), JSONStyle::Pretty);
  if (!text) throw std::runtime_error("the storebag can't be shown as JSON");
  return *std::move(text) + "\n";
}

std::string storebagAsTOML(const Dictionary& payload) {
  std::ostringstream out;
  out << toml::toml_formatter(tableFrom(payload)) << "\n";
  return out.str();
}

}  // namespace vesk
