// Typed reading of what a storebag says: a backend's profile, and the storebag's own entries.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Says, in one line of level 4, that `value` under `key` is not of the type that it must have.
void reportWrongType(std::string_view backendName, std::string_view key, const Value& value);

/// What `profile` holds under `key`. A storebag is signed, but its authors err: a value of the wrong type
/// counts as absent and costs one line, which names the backend and the key.
std::optional<std::string> profileText(std::string_view backendName, const Dictionary& profile,
                                       std::string_view key);
/// Boolean, integer or double, as it stands.
std::optional<Value> profileNumber(std::string_view backendName, const Dictionary& profile,
                                   std::string_view key);
/// A number, cut to an integer as `Value::asInteger` does.
std::optional<std::int64_t> profileInteger(std::string_view backendName, const Dictionary& profile,
                                           std::string_view key);
/// A number as above, or a text by its leading integer (0 when there is none).
std::optional<std::int64_t> profileIntegerOrNumericText(std::string_view backendName,
                                                        const Dictionary& profile, std::string_view key);
std::optional<List> profileList(std::string_view backendName, const Dictionary& profile,
                                std::string_view key);
/// An element that is no text is left out, with one line for the list.
std::optional<std::vector<std::string>> profileTextList(std::string_view backendName,
                                                        const Dictionary& profile, std::string_view key);
std::optional<Dictionary> profileDictionary(std::string_view backendName, const Dictionary& profile,
                                            std::string_view key);

}  // namespace vesk
