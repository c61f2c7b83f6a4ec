#include "backends/https/ListMatching.h"

#include <algorithm>

#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

template <class Matches>
bool matchAny(const NameList& list, std::optional<std::string_view> string, bool whitelist, Matches matches) {
  if (!list || list->empty()) return whitelist;
  if (!string) return !whitelist;
  return std::any_of(list->begin(), list->end(),
                     [&](const std::string& item) { return matches(item, *string); });
}

}  // namespace

bool matchExactStringWithList(const NameList& list, std::optional<std::string_view> wholeString,
                              bool whitelist) {
  return matchAny(list, wholeString, whitelist, [](const std::string& item, std::string_view whole) {
    return equalsIgnoringCase(item, whole);
  });
}

bool matchStringWithList(const NameList& list, std::optional<std::string_view> wholeString, bool whitelist) {
  return matchAny(list, wholeString, whitelist, [](const std::string& item, std::string_view whole) {
    return containsIgnoringCase(whole, item);
  });
}

std::vector<std::string> componentsSeparatedByComma(std::string_view text) {
  std::vector<std::string> components;
  while (true) {
    auto comma = text.find(',');
    components.emplace_back(text.substr(0, comma));
    if (comma == std::string_view::npos) return components;
    text.remove_prefix(comma + 1);
  }
}

}  // namespace vesk
