#include "storebag/StorebagProfile.h"

#include "platform/log/SystemLog.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::size_t kShown = 64;  // bytes of a value shown in a log line

/// The value under `key` if `accepts` returns true for it.
template <class Accepts>
const Value* find(std::string_view backendName, const Dictionary& profile, std::string_view key,
                  Accepts accepts) {
  const Value* value = profile.find(key);
  if (!value || accepts(*value)) return value;
  reportWrongType(backendName, key, *value);
  return nullptr;
}

}  // namespace

void reportWrongType(std::string_view backendName, std::string_view key, const Value& value) {
  VESK_LOG_WARNING("%.*s: The storebag's value for '%.*s' has the wrong type and counts as absent: %s",
                   static_cast<int>(backendName.size()), backendName.data(), static_cast<int>(key.size()),
                   key.data(), describe(value, kShown).c_str());
}

std::optional<std::string> profileText(std::string_view backendName, const Dictionary& profile,
                                       std::string_view key) {
  auto* value = find(backendName, profile, key, [](const Value& v) { return v.text() != nullptr; });
  if (!value) return std::nullopt;
  return value->text()->string();
}

std::optional<std::int64_t> profileInteger(std::string_view backendName, const Dictionary& profile,
                                           std::string_view key) {
  auto* value = find(backendName, profile, key, [](const Value& v) { return v.isNumber(); });
  if (!value) return std::nullopt;
  return value->asInteger();
}

std::optional<std::int64_t> profileIntegerOrNumericText(std::string_view backendName,
                                                        const Dictionary& profile, std::string_view key) {
  auto* value =
      find(backendName, profile, key, [](const Value& v) { return v.isNumber() || v.text() != nullptr; });
  if (!value) return std::nullopt;
  return integerForm(*value);
}

std::optional<List> profileList(std::string_view backendName, const Dictionary& profile,
                                std::string_view key) {
  auto* value = find(backendName, profile, key, [](const Value& v) { return v.list() != nullptr; });
  if (!value) return std::nullopt;
  return *value->list();
}

std::optional<Dictionary> profileDictionary(std::string_view backendName, const Dictionary& profile,
                                            std::string_view key) {
  auto* value = find(backendName, profile, key, [](const Value& v) { return v.dictionary() != nullptr; });
  if (!value) return std::nullopt;
  return *value->dictionary();
}

}  // namespace vesk
