#include <cmath>
#include <ctime>
#include <sstream>
#include <stdexcept>

#include "platform/crypto/Base64.h"
#include "platform/json/JSONWriter.h"
#include "platform/preferences/TomlLibrary.h"
#include "tools/storebag/StorebagSource.h"

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

toml::table tableFrom(const Dictionary& dictionary);
toml::array arrayFrom(const List& list);

/// Passes the value's TOML form to `put`. There is none for null.
template <class Put>
void convert(const Value& value, const Put& put) {
  if (const bool* boolean = value.boolean()) return put(*boolean);
  if (const double* real = value.real()) return put(*real);
  if (const Text* text = value.text()) return put(text->string());
  if (const Bytes* bytes = value.bytes()) return put(base64Encode(bytes->view()));
  if (const Date* date = value.date()) return put(dateTimeFrom(*date));
  if (const Dictionary* dictionary = value.dictionary()) return put(tableFrom(*dictionary));
  if (const List* list = value.list()) return put(arrayFrom(*list));
  if (auto number = value.asInteger()) put(*number);
}

toml::table tableFrom(const Dictionary& dictionary) {
  toml::table table;
  for (const auto& entry : dictionary)
    convert(entry.value, [&](auto form) { table.insert(entry.key.view(), std::move(form)); });
  return table;
}

toml::array arrayFrom(const List& list) {
  toml::array array;
  for (const Value& item : list) convert(item, [&](auto form) { array.push_back(std::move(form)); });
  return array;
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
