#include "tools/veskreport/PowerLogCommand.h"

#include <algorithm>
#include <charconv>
#include <filesystem>

#include "platform/files/RootPrefix.h"
#include "platform/time/CivilTime.h"
#include "tools/json/JSONReader.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/PowerLogReader.h"

namespace vesk {

namespace {

// Covers any time that a log can hold, and stays within the clock's range.
constexpr std::chrono::seconds kLongestAge = std::chrono::days(100'000);

std::optional<std::chrono::seconds> unitNamed(char letter) {
  switch (letter) {
    case 's':
      return std::chrono::seconds(1);
    case 'm':
      return std::chrono::minutes(1);
    case 'h':
      return std::chrono::hours(1);
    case 'd':
      return std::chrono::days(1);
    default:
      return std::nullopt;
  }
}

std::optional<std::chrono::seconds> ageMeantBy(const std::string& text) {
  if (text.empty()) return std::nullopt;
  auto unit = unitNamed(text.back());
  std::uint32_t count = 0;
  const char* last = text.data() + text.size() - 1;
  auto [end, error] = std::from_chars(text.data(), last, count);
  if (!unit || error != std::errc() || end != last) return std::nullopt;
  return std::min<std::chrono::seconds>(*unit * std::int64_t{count}, kLongestAge);
}

std::string isoTime(WallTime time) {
  std::string text = civilTime(time);
  text[text.find(' ')] = 'T';
  return text + "Z";
}

int show(const PowerLogEvent& event, const Output& output) {
  std::string line = civilTime(event.time) + "  " + std::to_string(event.identifier) + " " +
                     printable(event.name) + "  " + printable(event.dictionary);
  auto dictionary = parseJSON(event.dictionary, 64);
  return output.done(line, {{"time", std::chrono::duration<double>(event.time.time_since_epoch()).count()},
                            {"utc", isoTime(event.time)},
                            {"identifier", event.identifier},
                            {"name", event.name},
                            {"dictionary", dictionary ? *dictionary : Value()}});
}

}  // namespace

std::optional<WallTime> timeMeantBy(const std::string& text, WallTime now) {
  if (auto age = ageMeantBy(text)) return now - *age;
  int year = 0;
  unsigned month = 0;
  unsigned day = 0;
  unsigned hour = 0;
  unsigned minute = 0;
  unsigned second = 0;
  int used = 0;
  if (std::sscanf(text.c_str(), "%4d-%2u-%2u%n", &year, &month, &day, &used) != 3) return std::nullopt;
  const char* rest = text.c_str() + used;
  if (*rest != '\0') {
    used = 0;
    if (std::sscanf(rest, "%*1[T ]%2u:%2u:%2u%n", &hour, &minute, &second, &used) != 3) return std::nullopt;
    rest += used;
    if (*rest == 'Z') ++rest;
  }
  std::chrono::year_month_day date{std::chrono::year(year), std::chrono::month(month), std::chrono::day(day)};
  if (*rest != '\0' || !date.ok() || hour > 23 || minute > 59 || second > 60) return std::nullopt;
  return std::chrono::sys_days(date) + std::chrono::hours(hour) + std::chrono::minutes(minute) +
         std::chrono::seconds(second);
}

int runPowerLog(const Invocation& invocation, const Output& output) {
  WallTime since{};
  if (!invocation.powerLog.since.empty()) {
    auto meant = timeMeantBy(invocation.powerLog.since, WallClock::system().now());
    if (!meant) {
      output.failed("\"" + invocation.powerLog.since +
                    "\" is neither an age (15m) nor a time (2026-11-24T18:30:00Z)");
      return kExitUsage;
    }
    since = *meant;
  }
  const std::string path = pathUnderRoot(kPowerLogPath);
  std::error_code unknown;
  if (!std::filesystem::exists(path, unknown)) {
    return output.failed(path + ": " + (unknown ? unknown.message() : "nothing has been recorded"));
  }
  int status = kExitDone;
  const auto read = readPowerLog(path, since, [&](const PowerLogEvent& event) {
    status = show(event, output);
    return status == kExitDone;
  });
  return read ? status : output.failed(path + ": " + read.error().text);
}

}  // namespace vesk
