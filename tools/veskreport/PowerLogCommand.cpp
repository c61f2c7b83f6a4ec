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
constexpr std::size_t kBatchEvents = 500;
constexpr std::size_t kBatchBytes = std::size_t{1} << 20;

// The "+" keeps the planner from using the index of times and sorting.
constexpr char kEvents[] =
    "SELECT identifier, name, time, dictionary, id FROM events"
    " WHERE id BETWEEN ?1 AND ?2 AND +time >= ?3 ORDER BY id";

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

/// Reads up to a batch of events that begins with the row `next`, which then is the row after it. Returns
/// SQLITE_ROW while more may follow, SQLITE_DONE with the last batch.
int readBatch(sqlite3* database, std::int64_t& next, std::int64_t last, double since,
              std::vector<PowerLogEvent>& events) {
  auto row = prepare(database, kEvents);
  if (!row) return sqlite3_errcode(database);
  sqlite3_bind_int64(row.get(), 1, next);
  sqlite3_bind_int64(row.get(), 2, last);
  sqlite3_bind_double(row.get(), 3, since);
  int result = SQLITE_ROW;
  for (std::size_t bytes = 0; events.size() < kBatchEvents && bytes < kBatchBytes;) {
    result = sqlite3_step(row.get());
    if (result != SQLITE_ROW) break;
    events.push_back(eventIn(row.get()));
    bytes += events.back().dictionary.size();
    next = sqlite3_column_int64(row.get(), 4) + 1;
  }
  return result;
}

/// Reads in batches. An open statement keeps the file's state from its start and prevents the write-ahead log
/// from being reset, so none is open while events are passed on, which may take as long as a person reads.
/// Returns SQLITE_DONE or a result code that is an error.
int readBatches(sqlite3* database, double since, const std::function<bool(const PowerLogEvent&)>& take) {
  auto range = prepare(database, "SELECT min(id), max(id) FROM events WHERE time >= ?1");
  if (!range) return sqlite3_errcode(database);
  sqlite3_bind_double(range.get(), 1, since);
  int result = sqlite3_step(range.get());
  if (result == SQLITE_ROW && sqlite3_column_type(range.get(), 0) == SQLITE_NULL) return SQLITE_DONE;
  std::int64_t next = sqlite3_column_int64(range.get(), 0);
  const std::int64_t last = sqlite3_column_int64(range.get(), 1);
  range.reset();
  while (result == SQLITE_ROW) {
    std::vector<PowerLogEvent> events;
    result = readBatch(database, next, last, since, events);
    for (const PowerLogEvent& event : events)
      if (!take(event)) return SQLITE_DONE;
  }
  return result;
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

Result<void> readPowerLog(const std::string& path, WallTime since,
                          const std::function<bool(const PowerLogEvent& event)>& take) {
  sqlite3* opened = nullptr;
  const auto failure = [&opened] { return Error{Error::Kind::Failed, sqlite3_errmsg(opened)}; };
  int result = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
  SQLiteDatabase database(opened);
  if (result != SQLITE_OK) return failure();
  sqlite3_busy_timeout(opened, kBusyMilliseconds);
  if (readBatches(opened, secondsFrom(since), take) != SQLITE_DONE) return failure();
  return {};
}

int runPowerLog(const Invocation& invocation, const Output& output) {
  const WallTime since = startOf(invocation, output);
  const std::string path = pathUnderRoot(kPowerLogPath);
  std::error_code unknown;
  if (!std::filesystem::exists(path, unknown))
    return output.failed(path + ": " + (unknown ? unknown.message() : "nothing has been recorded"));
  int status = kExitDone;
  const auto read = readPowerLog(path, since, [&](const PowerLogEvent& event) {
    status = show(event, output);
    return status == kExitDone;
  });
  return read ? status : output.failed(path + ": " + read.error().text);
}

}  // namespace vesk
