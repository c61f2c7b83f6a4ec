#include "platform/device/DeviceInformation.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cctype>
#include <cstdlib>
#include <ctime>
#include <limits>

#include "platform/crypto/Digest.h"
#include "platform/device/FirmwareFacts.h"
#include "platform/files/RootPrefix.h"
#include "platform/files/SmallFile.h"
#include "platform/preferences/TomlFile.h"
#include "platform/sync/Mutex.h"
#include "platform/text/ASCII.h"
#include "platform/unicode/UTF8.h"
#include "platform/unicode/Unicode.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::size_t kLongestFact = 128;
constexpr std::size_t kLargestFile = 64 * 1024;

// Other services also derive identifiers from the machine ID. The label makes ours different, and the machine
// ID can't be computed from any of them.
constexpr char kDeviceIDLabel[] = "com.corvane.veskreportingd device identifier 1\n";
constexpr std::size_t kDeviceIDDigits = 40;

std::optional<std::string> factFromFile(std::string_view key) {
  const Dictionary facts = readTomlFile(pathUnderRoot("/etc/veskreporting/device.toml"));
  const Value* value = facts.find(key);
  return value ? stringForm(*value) : std::nullopt;
}

// A value in os-release is a shell word: plain, or quoted, where a backslash escapes the next character.
std::string unquoted(std::string_view word) {
  if (word.size() < 2 || (word.front() != '"' && word.front() != '\'') || word.back() != word.front()) {
    return std::string(word);
  }
  const bool takesBackslash = word.front() == '"';
  word = word.substr(1, word.size() - 2);
  std::string plain;
  for (std::size_t i = 0; i < word.size(); ++i) {
    if (takesBackslash && word[i] == '\\' && i + 1 < word.size()) ++i;
    plain += word[i];
  }
  return plain;
}

std::optional<std::string> osReleaseValue(std::string_view name) {
  auto file = readSmallFile(pathUnderRoot("/etc/os-release"), kLargestFile);
  if (!file) file = readSmallFile(pathUnderRoot("/usr/lib/os-release"), kLargestFile);
  if (!file) return std::nullopt;
  std::string_view rest = *file;
  while (!rest.empty()) {
    std::string_view line = rest.substr(0, rest.find('\n'));
    rest.remove_prefix(std::min(rest.size(), line.size() + 1));
    while (!line.empty() && std::isspace(static_cast<unsigned char>(line.back()))) line.remove_suffix(1);
    if (line.size() > name.size() && line.substr(0, name.size()) == name && line[name.size()] == '=') {
      return unquoted(line.substr(name.size() + 1));
    }
  }
  return std::nullopt;
}

std::optional<std::string> deviceIdentifier() {
  const auto file = readSmallFile(pathUnderRoot("/etc/machine-id"), 128);
  if (!file) return std::nullopt;
  const std::string_view machineID = std::string_view(*file).substr(0, file->find('\n'));
  const bool isMachineID =
      machineID.size() == 32 && std::all_of(machineID.begin(), machineID.end(), [](char c) {
        return std::isxdigit(static_cast<unsigned char>(c)) != 0;
      });
  if (!isMachineID) return std::nullopt;
  return hexLower(sha256(kDeviceIDLabel + lowercase(machineID))).substr(0, kDeviceIDDigits);
}

std::optional<std::string> factFromSystem(std::string_view key) {
  if (key == "ProductVersion") return osReleaseValue("VERSION_ID");
  if (key == "BuildVersion") {
    auto build = osReleaseValue("BUILD_ID");
    return build ? build : osReleaseValue("VERSION");
  }
  if (key == "UniqueDeviceID") return deviceIdentifier();
  auto fact = firmwareFact(key);
  // Virtual machines and containers have no firmware facts, but reporting needs a device name.
  return !fact && key == "DeviceName" ? osReleaseValue("NAME") : fact;
}

bool isUsable(const std::string& fact) {
  return !fact.empty() && fact.size() <= kLongestFact && isValidUTF8(fact) &&
         std::none_of(fact.begin(), fact.end(), isControl);
}

std::optional<std::string> countryCode(std::string_view candidate) {
  if (candidate.size() != 2) return std::nullopt;
  std::string code;
  for (char c : candidate) {
    if (c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
    if (c < 'A' || c > 'Z') return std::nullopt;
    code += c;
  }
  return code;
}

// "language_COUNTRY.encoding@modifier", where everything but the language is optional.
std::optional<std::string> countryOfLocale(std::string_view locale) {
  locale = locale.substr(0, locale.find_first_of(".@"));
  std::size_t separator = locale.find('_');
  if (separator == std::string_view::npos) return std::nullopt;
  return countryCode(locale.substr(separator + 1));
}

int localOffset(std::time_t seconds) {
  // tzset reads a changed zone; localtime_r alone would keep the zone from the start of the process. The lock
  // is needed because tzset replaces the C library's state.
  static Mutex mutex;
  MutexLock lock(mutex);
  ::tzset();
  std::tm local{};
  return ::localtime_r(&seconds, &local) ? static_cast<int>(local.tm_gmtoff) : 0;
}

}  // namespace

std::optional<std::string> QNCopyAnswer(std::string_view key) {
  auto fact = factFromFile(key);
  if (fact && isUsable(*fact)) return fact;
  fact = factFromSystem(key);
  return fact && isUsable(*fact) ? fact : std::nullopt;
}

std::optional<std::string> regionCode() {
  if (auto fact = QNCopyAnswer("RegionCode")) {
    if (auto code = countryCode(*fact)) return code;
  }
  for (const char* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
    const char* locale = std::getenv(name);
    if (locale && *locale) return countryOfLocale(locale);
  }
  return std::nullopt;
}

int timezoneOffsetSeconds(WallTime time) {
  // The last answer and its minute in one word. Time zones change their offset only at the start of a minute.
  static std::atomic<std::int64_t> lastAnswer{std::numeric_limits<std::int64_t>::min()};
  constexpr std::int64_t kOffsetRange = 1 << 20;
  const std::int64_t minute = std::chrono::floor<std::chrono::minutes>(time).time_since_epoch().count();
  const std::int64_t last = lastAnswer.load(std::memory_order_relaxed);
  const std::int64_t lastMinute = last >> 20;
  if (lastMinute == minute) return static_cast<int>((last & (kOffsetRange - 1)) - kOffsetRange / 2);
  const int offset = localOffset(static_cast<std::time_t>(minute * 60));
  lastAnswer.store((minute << 20) | (offset + kOffsetRange / 2), std::memory_order_relaxed);
  return offset;
}

}  // namespace vesk
