#include "tools/veskreport/PowerLogReader.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <filesystem>
#include <vector>

#include "platform/files/RootPrefix.h"
#include "platform/sqlite/SQLiteHandles.h"
#include "tools/json/JSONReader.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"

namespace vesk {

namespace {

constexpr int kBusyMilliseconds = 5000;
constexpr char kEvents[] =
    "SELECT identifier, name, time, dictionary FROM events WHERE time >= ?1 ORDER BY id";

std::string textIn(sqlite3_stmt* row, int column) {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(row, column));
  return text ? std::string(text, static_cast<std::size_t>(sqlite3_column_bytes(row, column)))
              : std::string();
}

PowerLogEvent eventIn(sqlite3_stmt* row) {
  PowerLogEvent event;
  event.identifier = static_cast<std::uint32_t>(sqlite3_column_int64(row, 0));
  event.name = textIn(row, 1);
  event.time = WallTime(std::chrono::microseconds(std::llround(sqlite3_column_double(row, 2) * 1e6)));
  event.dictionary = textIn(row, 3);
  return event;
}

// Covers any time that a log can hold, and stays within the clock's range.
constexpr std::chrono::seconds kLongestAge = std::chrono::days(100'000);

/// "90s", "15m", "2h" or "7d".
std::optional<std::chrono::seconds> ageMeantBy(const std::string& text) {
  constexpr std::pair<char, std::chrono::seconds> kUnits[] = {{'s', std::chrono::seconds(1)},
                                                              {'m', std::chrono::minutes(1)},
                                                              {'h', std::chrono::hours(1)},
                                                              {'d', std::chrono::days(1)}};
  std::uint32_t count = 0;
  const char* last = text.data() + text.size() - 1;
  auto [end, error] = std::from_chars(text.data(), last, count);
  if (error != std::errc() || end != last) return std::nullopt;
  for (auto [letter, unit] : kUnits)
    if (*last == letter) return std::min<std::chrono::seconds>(unit * std::int64_t{count}, kLongestAge);
  return std::nullopt;
}

/// An age before `now`, or a UTC time such as "2026-11-24T18:30:00Z", where the time of day and the "Z" are
/// optional. Returns nullopt for any other text.
std::optional<WallTime> timeMeantBy(const std::string& text, WallTime now) {
  if (auto age = ageMeantBy(text)) return now - *age;
  std::tm parts{};
  const char* rest = ::strptime(text.c_str(), "%Y-%m-%d", &parts);
  if (rest != nullptr && (*rest == 'T' || *rest == ' ')) {
    rest = ::strptime(rest + 1, "%H:%M:%S", &parts);
    if (rest != nullptr && *rest == 'Z') ++rest;
  }
  const std::chrono::year_month_day date(std::chrono::year(parts.tm_year + 1900),
                                         std::chrono::month(static_cast<unsigned>(parts.tm_mon + 1)),
                                         std::chrono::day(static_cast<unsigned>(parts.tm_mday)));
  if (rest == nullptr || *rest != '\0' || !date.ok() || parts.tm_sec > 60) return std::nullopt;
  return WallTime(std::chrono::seconds(::timegm(&parts)));
}

WallTime startOf(const Invocation& invocation, const Output& output) {
  const std::string& since = invocation.since;
  if (since.empty()) return {};
  auto meant = timeMeantBy(since, WallClock::system().now());
  if (!meant)
    output.fail("\"" + since + "\" is neither an age (15m) nor a time (2026-11-24T18:30:00Z)", kExitUsage);
  return *meant;
}

int show(const PowerLogEvent& event, const Output& output) {
  std::string line = civilTime(event.time) + "  " + std::to_string(event.identifier) + " " +
                     printable(event.name) + "  " + printable(event.dictionary);
  auto dictionary = parseJSON(event.dictionary, 64);
  return output.done(line, {{"time", secondsFrom(event.time)},
                            {"utc", isoTime(event.time)},
                            {"identifier", event.identifier},
                            {"name", event.name},
                            {"dictionary", dictionary ? *dictionary : Value()}});
}

}  // namespace

Result<std::vector<PowerLogEvent>> readPowerLog(const std::string& path, WallTime since) {
  sqlite3* opened = nullptr;
  int result = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
  SQLiteDatabase database(opened);
  std::vector<PowerLogEvent> events;
  if (result == SQLITE_OK) {
    sqlite3_busy_timeout(opened, kBusyMilliseconds);
    auto row = prepare(opened, kEvents);
    sqlite3_bind_double(row.get(), 1, secondsFrom(since));
    while (row && (result = sqlite3_step(row.get())) == SQLITE_ROW) events.push_back(eventIn(row.get()));
  }
  if (result != SQLITE_DONE) return Error{Error::Kind::Failed, sqlite3_errmsg(opened)};
  return events;
}

int runPowerLog(const Invocation& invocation, const Output& output) {
  const WallTime since = startOf(invocation, output);
  const std::string path = pathUnderRoot(kPowerLogPath);
  std::error_code unknown;
  if (!std::filesystem::exists(path, unknown))
    return output.failed(path + ": " + (unknown ? unknown.message() : "nothing has been recorded"));
  const auto events = readPowerLog(path, since);
  if (!events) return output.failed(path + ": " + events.error().text);
  for (const PowerLogEvent& event : *events)
    if (const int status = show(event, output); status != kExitDone) return status;
  return kExitDone;
}

}  // namespace vesk
