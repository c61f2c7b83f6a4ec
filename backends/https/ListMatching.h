// Matches names against the lists of a storebag's client entry.
#pragma once

#include <optional>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A list of texts, or nullopt if absent.
using NameList = std::optional<List>;

/// Returns true if an item equals the whole string, ignoring case. Returns `whitelist` for an absent or empty
/// list, its negation for an absent string.
bool matchExactStringWithList(const NameList& list, std::optional<std::string_view> wholeString,
                              bool whitelist);

/// Returns true if an item occurs anywhere in the string, ignoring case; an empty item never matches. Special
/// cases as above.
bool matchStringWithList(const NameList& list, std::optional<std::string_view> wholeString, bool whitelist);

/// The pieces of a text between commas, empty ones included.
List componentsSeparatedByComma(std::string_view text);

}  // namespace vesk
