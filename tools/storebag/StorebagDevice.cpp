#include "tools/storebag/StorebagDevice.h"

#include <algorithm>
#include <charconv>

#include "platform/text/ASCII.h"
#include "storebag/Settings.h"
#include "storebag/StorebagNaming.h"
#include "tools/storebag/StorebagKeys.h"
#include "tools/storebag/StorebagSource.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::string_view kEnvironment = "environment";

bool isRegionCode(std::string_view text) {
  const auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); };
  return text.size() == 2 && std::ranges::all_of(text, isLetter);
}

/// Why the value can't stand under that key; nullopt if it can.
std::optional<std::string> problemOf(std::string_view key, const Value& value) {
  if (key == kEnvironment) {
    const Text* name = value.text();
    const auto known = environmentNames();
    if (name != nullptr && std::ranges::find(known, name->view()) != known.end()) return std::nullopt;
    return "no environment has the name " + describe(value, 60) +
           (name != nullptr ? nearestWord(name->view(), known) : "");
  }
  const StorebagKey* known = keyNamed(deviceFactKeys(), key);
  if (known == nullptr) known = keyNamed(preferenceKeys(), key);
  if (known == nullptr) return "unknown fact" + nearestKey(key, deviceFactKeys());
  // A version such as 12 is a number in TOML; the daemon takes its text.
  const bool fits =
      known->type == KeyType::Text ? stringForm(value).has_value() : hasType(value, known->type);
  if (fits && key == "RegionCode" && !isRegionCode(*stringForm(value)))
    return "must be two letters, is " + describe(value, 60) + "; the daemon would take it as absent";
  if (fits) return std::nullopt;
  return "must be " + std::string(nameOf(known->type)) + ", is " + describe(value, 60);
}

std::int32_t environmentTypeNamed(std::string_view name) {
  const auto known = environmentNames();
  return static_cast<std::int32_t>(std::ranges::find(known, name) - known.begin()) + 1;
}

std::optional<Text> textOf(const Dictionary& facts, std::string_view key) {
  const Value* value = facts.find(key);
  const auto text = value != nullptr ? stringForm(*value) : std::nullopt;
  return text ? std::optional(Text(*text)) : std::nullopt;
}

PostPolicy::Settings initialFrom(const Dictionary& facts) {
  PostPolicy::Settings settings;
  if (const auto url = textOf(facts, "httpsPostURL")) settings._postURL = url->string();
  if (const auto url = textOf(facts, "httpsRealtimePostURL")) settings._realtimePostURL = url->string();
  settings._useDefaultPostURL = settings._postURL.has_value();
  settings._useDefaultRealtimePostURL = settings._realtimePostURL.has_value();
  return settings;
}

/// true, false and integers as such, anything else as text.
Value valueMeantBy(std::string_view word) {
  if (word == "true" || word == "false") return word == "true";
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(word.data(), word.data() + word.size(), number);
  if (error == std::errc() && end == word.data() + word.size()) return number;
  return word;
}

}  // namespace

std::string StorebagDevice::environment() const {
  return std::string(environmentNameForType(environmentType).value_or("(none)"));
}

Result<StorebagDevice> storebagDevice(const Dictionary& facts) {
  for (const auto& [key, value] : facts) {
    if (const auto problem = problemOf(key.view(), value)) return malformed(key.string() + ": " + *problem);
  }
  StorebagDevice device;
  if (const auto family = textOf(facts, "DeviceName")) device.productFamily = family->string();
  if (const auto region = textOf(facts, "RegionCode")) device.regionCode = region->string();
  device.hardwareType = textOf(facts, "ProductType");
  device.productVersion = textOf(facts, "ProductVersion");
  device.buildVersion = textOf(facts, "BuildVersion");
  device.isInternal = facts.text("ReleaseType") == Text::literal("Internal");
  device.dnuEnabled = booleanForKey(facts, "diagnosticsSubmission").value_or(true);
  if (const Value* type = facts.find("environmentType"))
    device.environmentType = environmentTypeForPreference(*type);
  if (const auto name = facts.text(kEnvironment)) device.environmentType = environmentTypeNamed(name->view());
  device.initial = initialFrom(facts);
  return device;
}

Result<Dictionary> deviceFactsIn(const std::string& argument) {
  if (argument.find('=') == std::string::npos) return readTomlOrJSON(argument);
  MutableDictionary facts;
  for (std::string_view rest = argument; !rest.empty();) {
    const std::string_view pair = rest.substr(0, rest.find(','));
    rest.remove_prefix(std::min(rest.size(), pair.size() + 1));
    const auto equals = pair.find('=');
    if (equals == std::string_view::npos)
      return malformed("'" + std::string(pair) + "' is no key=value; write a list such as " +
                       "RegionCode=DE,DeviceName=Pine or the path of a file");
    facts.set(Text(trimmed(pair.substr(0, equals))), valueMeantBy(trimmed(pair.substr(equals + 1))));
  }
  return facts.share();
}

}  // namespace vesk
