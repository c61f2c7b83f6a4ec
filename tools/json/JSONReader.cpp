#include "tools/json/JSONReader.h"

#include <algorithm>
#include <boost/json.hpp>

namespace vesk {

namespace {

namespace json = boost::json;

Value valueFrom(const json::value& read);

Dictionary dictionaryFrom(const json::object& read) {
  MutableDictionary entries;
  entries.reserve(read.size());
  for (const auto& [key, value] : read) entries.append(Text(std::string_view(key)), valueFrom(value));
  return entries.share();
}

List listFrom(const json::array& read) {
  std::vector<Value> values;
  values.reserve(read.size());
  for (const auto& value : read) values.push_back(valueFrom(value));
  return List(std::move(values));
}

Value valueFrom(const json::value& read) {
  switch (read.kind()) {
    case json::kind::null:
      return {};
    case json::kind::bool_:
      return read.get_bool();
    case json::kind::int64:
      return read.get_int64();
    case json::kind::uint64:
      return read.get_uint64();
    case json::kind::double_:
      return read.get_double();
    case json::kind::string:
      return std::string_view(read.get_string());
    case json::kind::array:
      return listFrom(read.get_array());
    case json::kind::object:
      return dictionaryFrom(read.get_object());
  }
  return {};
}

std::string located(std::string_view text, std::size_t offset, const std::string& words) {
  std::string_view before = text.substr(0, offset);
  auto line = std::count(before.begin(), before.end(), '\n') + 1;
  auto column = offset - (before.rfind('\n') + 1) + 1;  // npos + 1 is 0, the start of the text
  return "line " + std::to_string(line) + ", column " + std::to_string(column) + ": " + words;
}

}  // namespace

Result<Value> parseJSON(std::string_view text, std::size_t depth) {
  json::parse_options options;
  options.max_depth = depth;
  json::stream_parser parser({}, options);
  boost::system::error_code error;
  std::size_t read = parser.write(text.data(), text.size(), error);
  if (!error) parser.finish(error);
  if (error) return malformed(located(text, read, error.message()));
  return valueFrom(parser.release());
}

}  // namespace vesk
