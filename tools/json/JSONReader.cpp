#include "tools/json/JSONReader.h"

#include <algorithm>
#include <boost/json.hpp>

namespace vesk {

namespace {

namespace json = boost::json;

struct Conversion {
  Value operator()(std::nullptr_t) const { return {}; }
  Value operator()(const json::string& text) const { return std::string_view(text); }
  Value operator()(const json::array& array) const {
    std::vector<Value> values;
    values.reserve(array.size());
    for (const auto& value : array) values.push_back(json::visit(*this, value));
    return List(std::move(values));
  }
  Value operator()(const json::object& object) const {
    MutableDictionary entries;
    entries.reserve(object.size());
    for (const auto& [key, value] : object)
      entries.append(Text(std::string_view(key)), json::visit(*this, value));
    return entries.share();
  }
  template <class Number>
  Value operator()(Number number) const {
    return number;
  }
};

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
  return json::visit(Conversion(), parser.release());
}

}  // namespace vesk
