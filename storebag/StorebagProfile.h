// Typed access to a storebag: to a backend's profile and to the storebag's own entries.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Logs one line of level 4: `value` under `key` does not have the required type.
void reportWrongType(std::string_view backendName, std::string_view key, const Value& value);

/// The value of `profile` under `key`. Storebags are signed but may contain mistakes: a value of the wrong
/// type counts as absent, with one line that names the backend and the key.
std::optional<std::string> profileText(std::string_view backendName, const Dictionary& profile,
                                       std::string_view key);
/// A number, converted to an integer by `Value::asInteger`.
std::optional<std::int64_t> profileInteger(std::string_view backendName, const Dictionary& profile,
                                           std::string_view key);
/// A number as above, or text by its leading integer (0 if there is none).
std::optional<std::int64_t> profileIntegerOrNumericText(std::string_view backendName,
                                                        const Dictionary& profile, std::string_view key);
std::optional<List> profileList(std::string_view backendName, const Dictionary& profile,
                                std::string_view key);
std::optional<Dictionary> profileDictionary(std::string_view backendName, const Dictionary& profile,
                                            std::string_view key);

}  // namespace vesk
