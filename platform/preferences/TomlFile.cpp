#include "platform/preferences/TomlFile.h"

#include <algorithm>
#include <chrono>
#include <sstream>

#include "platform/log/SystemLog.h"
#include "platform/preferences/TomlLibrary.h"

namespace vesk {

namespace {

constexpr std::size_t kLargestDocument = 1 << 20;
constexpr std::size_t kMostDotsInAKey = 6;

double secondsOf(const toml::date& date) {
  auto day = std::chrono::year(date.year) / std::chrono::month(date.month) / std::chrono::day(date.day);
  return static_cast<double>(std::chrono::sys_seconds(std::chrono::sys_days(day)).time_since_epoch().count());
}

struct Conversion {
  Value operator()(const toml::table& table) const {
    MutableDictionary entries;
    entries.reserve(table.size());
    for (const auto& [key, node] : table) entries.append(Text(key.str()), node.visit(*this));
    return entries.share();
  }
  Value operator()(const toml::array& array) const {
    std::vector<Value> values;
    values.reserve(array.size());
    for (const auto& node : array) values.push_back(node.visit(*this));
    return List(std::move(values));
  }
  Value operator()(const toml::value<toml::date>& date) const { return Date{secondsOf(date.get())}; }
  Value operator()(const toml::value<toml::date_time>& dateTime) const {
    const toml::date_time& when = dateTime.get();
    const int seconds = when.time.hour * 3600 + when.time.minute * 60 + when.time.second -
                        (when.offset ? when.offset->minutes * 60 : 0);
    return Date{secondsOf(when.date) + seconds + when.time.nanosecond / 1e9};
  }
  Value operator()(const toml::value<toml::time>& time) const {
    std::ostringstream out;
    out << time.get();
    return out.str();
  }
  template <class Plain>
  Value operator()(const toml::value<Plain>& value) const {
    return value.get();
  }
};

/// The index after the string that starts at `start`.
std::size_t endOfString(std::string_view text, std::size_t start) {
  const char quote = text[start];
  const std::string triple(3, quote);
  const bool isMultiline = text.substr(start, 3) == triple;
  std::size_t at = start + (isMultiline ? 3 : 1);
  while (at < text.size()) {
    if (text[at] == '\\' && quote == '"') {
      at += 2;
    } else if (isMultiline && text.substr(at, 3) == triple) {
      // Up to two more quotes belong to the contents.
      const std::size_t end = text.find_first_not_of(quote, at + 3);
      return std::min({end, at + 5, text.size()});
    } else if (!isMultiline && (text[at] == quote || text[at] == '\n')) {
      return at + 1;
    } else {
      ++at;
    }
  }
  return text.size();
}

// A dotted key creates one nested table for each dot, and the parser frees them recursively.
bool hasKeyOfManyParts(std::string_view text) {
  std::size_t dots = 0;
  for (std::size_t at = 0; at < text.size();) {
    const char c = text[at];
    if (c == '"' || c == '\'') {
      at = endOfString(text, at);
      continue;
    }
    if (c == '#') {
      at = std::min(text.find('\n', at), text.size());
      continue;
    }
    if (c == '.' && ++dots > kMostDotsInAKey) return true;
    if (std::string_view("\n=,[]{}").find(c) != std::string_view::npos) dots = 0;
    ++at;
  }
  return false;
}

}  // namespace

Result<Dictionary> parseToml(std::string_view text) {
  if (text.size() > kLargestDocument) return malformed("larger than 1 MiB");
  if (hasKeyOfManyParts(text)) return malformed("a key with more than 7 parts");
  toml::parse_result result = toml::parse(text);
  if (result) return *Conversion()(result.table()).dictionary();
  const toml::parse_error& error = result.error();
  std::ostringstream words;
  words << "line " << error.source().begin.line << ", column " << error.source().begin.column << ": "
        << error.description();
  return malformed(words.str());
}

Dictionary readTomlFile(const std::string& path, TrustedOwner owner) {
  const auto bytes = readTrustedFile(path, kLargestDocument, owner);
  auto document = bytes ? parseToml(*bytes) : bytes.error();
  if (document) return *std::move(document);
  // An untrusted file has been reported where it was refused.
  const Error& error = document.error();
  if (error.kind != Error::Kind::Missing && error.kind != Error::Kind::Untrusted)
    VESK_LOG_WARNING("%s is ignored: %s", path.c_str(), error.text.c_str());
  return {};
}

}  // namespace vesk
