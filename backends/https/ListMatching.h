// How a client entry of a storebag is matched with names.
#pragma once

#include <optional>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Absent or not, a list of texts.
using NameList = std::optional<List>;

/// True when an item equals the whole string, ignoring case. An absent or empty list gives `whitelist`, an
/// absent string its negation.
bool matchExactStringWithList(const NameList& list, std::optional<std::string_view> wholeString,
                              bool whitelist);

/// True when an item occurs anywhere in the string, ignoring case; an empty item never does. Special cases as
/// above.
bool matchStringWithList(const NameList& list, std::optional<std::string_view> wholeString, bool whitelist);

/// The pieces of a text between commas, empty ones included.
List componentsSeparatedByComma(std::string_view text);

}  // namespace vesk
