#include "storebag/Settings.h"

#include <atomic>
#include <charconv>
#include <mutex>

#include "platform/log/SystemLog.h"
#include "platform/preferences/PreferencesSuite.h"
#include "util/ReportingdUtil.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::string_view kSuite = "com.corvane.veskreporting";
constexpr std::int32_t kDefaultEnvironment = kSeedEnvironment;
constexpr std::int64_t kEnvironmentTypes = 5;  // including 0, which has no section

std::atomic<std::int32_t> processEnvironmentType{0};

}  // namespace

bool diagnosticsSubmissionConsent() { return preferenceFlagForKey("diagnosticsSubmission"); }

std::int32_t environmentTypeForPreference(const std::optional<Value>& preference) {
  if (!preference) return kDefaultEnvironment;
  std::int64_t value = integerForm(*preference);
  if (value >= 0 && value < kEnvironmentTypes) return static_cast<std::int32_t>(value);
  VESK_LOG_ERROR("userDefaultsEnvironment: Invalid environment type %u", static_cast<unsigned>(value));
  return kInternalEnvironment;
}

void userDefaultsEnvironment() {
  std::int32_t type = environmentTypeForPreference(PreferencesSuite(kSuite).valueForKey("environmentType"));
  processEnvironmentType = type;
  VESK_LOG_INFO("userDefaultsEnvironment: Environment type %u", static_cast<unsigned>(type));
}

std::int32_t currentEnvironmentType() {
  static std::once_flag once;
  std::call_once(once, userDefaultsEnvironment);
  return processEnvironmentType;
}

std::optional<std::string> preferenceStringForKey(std::string_view key) {
  auto value = PreferencesSuite(kSuite).valueForKey(key);
  if (!value) return std::nullopt;
  return stringForm(*value);
}

bool preferenceFlagForKey(std::string_view key) {
  auto value = PreferencesSuite(kSuite).valueForKey(key);
  return value && value->boolean() && *value->boolean();
}

std::optional<std::uint64_t> preferenceNumberForKey(std::string_view key, std::uint64_t least) {
  auto text = preferenceStringForKey(key);
  if (!text) return std::nullopt;
  std::uint64_t number = 0;
  auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
  if (error == std::errc() && end == text->data() + text->size() && number >= least) return number;
  VESK_LOG_WARNING("main: The preference %.*s is no number from %llu on and counts as absent",
                   static_cast<int>(key.size()), key.data(), static_cast<unsigned long long>(least));
  return std::nullopt;
}

std::string storebagServerBaseURLFor(const std::optional<std::string>& override, bool internalBuild) {
  if (override) return *override;
  return internalBuild ? "https://" VESK_PARTNER_STOREBAG_HOST "/storebags/sorrel"
                       : "https://" VESK_STOREBAG_HOST "/bags/sorrel";
}

std::string storebagServerBaseURL() {
  static const std::optional<std::string> override = preferenceStringForKey("veskreporting_storebag_url");
  // The kind of build is only determined if it decides.
  return storebagServerBaseURLFor(override, !override && isInternalBuild());
}

}  // namespace vesk
