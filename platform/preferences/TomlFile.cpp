#include "platform/preferences/TomlFile.h"

#define TOML_MAX_NESTED_VALUES 32
#define TOML_EXCEPTIONS 0
#define TOML_ENABLE_FORMATTERS 0
#include <toml++/toml.h>

#include <algorithm>
#include <chrono>
#include <sstream>

#include "platform/files/SmallFile.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr std::size_t kLargestDocument = 1 << 20;
constexpr std::ptrdiff_t kMostDotsInALine = 256;

Value valueFromNode(const toml::node& node);

Dictionary dictionaryFromTable(const toml::table& table) {
  MutableDictionary entries;
  entries.reserve(table.size());
  for (const auto& [key, node] : table) entries.append(Text(key.str()), valueFromNode(node));
  return entries.share();
}

List listFromArray(const toml::array& array) {
  std::vector<Value> values;
  values.reserve(array.size());
  for (const auto& node : array) values.push_back(valueFromNode(node));
  return List(std::move(values));
}

std::int64_t secondsOfDay(const toml::date& date) {
  auto day = std::chrono::year(date.year) / std::chrono::month(date.month) / std::chrono::day(date.day);
  return std::chrono::sys_seconds(std::chrono::sys_days(day)).time_since_epoch().count();
}

Date dateFrom(const toml::date_time& when) {
  const std::int64_t seconds = secondsOfDay(when.date) + when.time.hour * 3600 + when.time.minute * 60 +
                               when.time.second - (when.offset ? when.offset->minutes * 60 : 0);
  return Date{static_cast<double>(seconds) + when.time.nanosecond / 1e9};
}

template <class T>
Text textFrom(const T& printable) {
  std::ostringstream out;
  out << printable;
  return Text(out.str());
}

Value valueFromNode(const toml::node& node) {
  switch (node.type()) {
    case toml::node_type::table:
      return dictionaryFromTable(*node.as_table());
    case toml::node_type::array:
      return listFromArray(*node.as_array());
    case toml::node_type::string:
      return Text(node.as_string()->get());
    case toml::node_type::integer:
      return node.as_integer()->get();
    case toml::node_type::floating_point:
      return node.as_floating_point()->get();
    case toml::node_type::boolean:
      return node.as_boolean()->get();
    case toml::node_type::date:
      return Date{static_cast<double>(secondsOfDay(node.as_date()->get()))};
    case toml::node_type::date_time:
      return dateFrom(node.as_date_time()->get());
    case toml::node_type::time:
      return textFrom(node.as_time()->get());
    case toml::node_type::none:
      break;
  }
  return {};
}

// A dotted key makes one table within another for each dot, and those are released recursively.
bool hasLineOfManyDots(std::string_view text) {
  while (!text.empty()) {
    std::string_view line = text.substr(0, text.find('\n'));
    if (std::count(line.begin(), line.end(), '.') > kMostDotsInALine) return true;
    text.remove_prefix(std::min(text.size(), line.size() + 1));
  }
  return false;
}

}  // namespace

TomlOutcome parseToml(std::string_view text) {
  if (text.size() > kLargestDocument) return {std::nullopt, "larger than 1 MiB"};
  if (hasLineOfManyDots(text)) return {std::nullopt, "a line with more than 256 dots"};
  toml::parse_result result = toml::parse(text);
  if (result) return {dictionaryFromTable(result.table()), {}};
  const toml::parse_error& error = result.error();
  std::ostringstream words;
  words << "line " << error.source().begin.line << ", column " << error.source().begin.column << ": "
        << error.description();
  return {std::nullopt, words.str()};
}

Dictionary readTomlFile(const std::string& path) {
  SmallFile file = readSmallFile(path, kLargestDocument);
  if (!file.bytes) {
    if (!file.missing) VESK_LOG_WARNING("%s is ignored: %s", path.c_str(), file.error.c_str());
    return {};
  }
  TomlOutcome outcome = parseToml(*file.bytes);
  if (!outcome.document) {
    VESK_LOG_WARNING("%s is ignored: %s", path.c_str(), outcome.error.c_str());
    return {};
  }
  return *std::move(outcome.document);
}

}  // namespace vesk
