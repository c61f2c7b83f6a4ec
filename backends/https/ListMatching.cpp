#include "backends/https/ListMatching.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

template <class Matches>
bool matchAny(const NameList& list, std::optional<std::string_view> string, bool whitelist, Matches matches) {
  if (!list || list->empty()) return whitelist;
  if (!string) return !whitelist;
  return std::any_of(list->begin(), list->end(),
                     [&](const Value& item) { return matches(item.text()->view(), *string); });
}

}  // namespace

bool matchExactStringWithList(const NameList& list, std::optional<std::string_view> wholeString,
                              bool whitelist) {
  return matchAny(list, wholeString, whitelist, [](std::string_view item, std::string_view whole) {
    return equalsIgnoringCase(item, whole);
  });
}

bool matchStringWithList(const NameList& list, std::optional<std::string_view> wholeString, bool whitelist) {
  return matchAny(list, wholeString, whitelist, [](std::string_view item, std::string_view whole) {
    return containsIgnoringCase(whole, item);
  });
}

List componentsSeparatedByComma(std::string_view text) {
  std::vector<Value> components;
  while (true) {
    auto comma = text.find(',');
    components.emplace_back(text.substr(0, comma));
    if (comma == std::string_view::npos) return List(std::move(components));
    text.remove_prefix(comma + 1);
  }
}

}  // namespace vesk
