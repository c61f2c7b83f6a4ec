// The keys of a storebag, and of the files that decide with it: the only list of them, from which checks, the
// JSON Schema and the reference pages are made.
#pragma once

#include <cstdint>
#include <limits>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

enum class KeyType : unsigned char {
  Text,
  URL,      ///< a text; that it is a URL is a matter of use, not of type
  Address,  ///< likewise, an IPv4 address
  Number,
  Integer,  ///< a number, of which the daemon takes the whole part
  Flag,     ///< a number, 0 or 1
  IntegerOrText,
  Serial,
  Date,
  Boolean,
  Texts,
  Tables,
  Table
};

/// One key, as authors need to know it.
struct StorebagKey {
  std::string_view key;
  KeyType type;
  std::string_view effect;
  std::string_view example = {};  ///< its value in TOML
  std::string_view absent = {};   ///< what applies without it: a value in JSON, or words
  std::string_view unit = {};
  std::string_view withoutIt = {};             ///< the consequence of a missing key, if it deserves a warning
  std::span<const StorebagKey> contents = {};  ///< of a table, or of each table in a list
  std::span<const std::string_view> words = {};  ///< the only values that have an effect, if they are few
  double least = -std::numeric_limits<double>::infinity();
  double most = std::numeric_limits<double>::infinity();
  std::string_view below = {};  ///< what becomes of a number below that range; empty: it is as good as any
  std::string_view above = {};  ///< likewise, above it
  bool mustBeWithin = false;    ///< outside, the value can't work
};

/// What a missing key or an unusable value does to its backend.
inline constexpr std::string_view kNotBuilt = "the backend is not built";

/// A group of keys under a title, for the reference.
struct StorebagKeyGroup {
  std::string_view title;
  std::string_view where;  ///< a sentence
  std::span<const StorebagKey> keys;
};

/// The keys beside the environment sections.
std::span<const StorebagKey> topLevelKeys();
/// A section's backends.
std::span<const StorebagKey> backendKeys();
/// The device's facts that decide about reporting, and the preferences.
std::span<const StorebagKey> deviceFactKeys();
std::span<const StorebagKey> preferenceKeys();
/// All of the above, in the reference's order.
std::vector<StorebagKeyGroup> storebagKeyGroups();

/// The environments' names, in the order of their numbers, which start with 1.
std::span<const std::string_view> environmentNames();

const StorebagKey* keyNamed(std::span<const StorebagKey> keys, std::string_view name);

bool hasType(const Value& value, KeyType type);
/// Such as "a list of texts".
std::string_view nameOf(KeyType type);

/// "; did you mean 'post_url'?" if one of the keys is spelt like `name`, otherwise nothing.
std::string nearestKey(std::string_view name, std::span<const StorebagKey> keys);
std::string nearestWord(std::string_view word, std::span<const std::string_view> words);

}  // namespace vesk
