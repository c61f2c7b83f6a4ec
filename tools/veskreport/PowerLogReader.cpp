#include "tools/veskreport/PowerLogReader.h"

#include <cmath>
#include <vector>

#include "platform/sqlite/SQLiteHandles.h"

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

/// Reads the events in batches. An open statement keeps the file's state from its start and prevents the
/// write-ahead log from being reset, so none is open while events are passed on, which may take as long as a
/// person reads.
class Batches {
 public:
  Batches(sqlite3* database, double since) : _database(database), _since(since) {}

  /// Finds the first and last rows. Returns a result code of SQLite.
  int begin() {
    auto range = prepare(_database, "SELECT min(id), max(id) FROM events WHERE time >= ?1");
    if (!range) return sqlite3_errcode(_database);
    sqlite3_bind_double(range.get(), 1, _since);
    const int result = sqlite3_step(range.get());
    if (result != SQLITE_ROW) return result;
    if (sqlite3_column_type(range.get(), 0) == SQLITE_NULL) return SQLITE_DONE;
    _next = sqlite3_column_int64(range.get(), 0);
    _last = sqlite3_column_int64(range.get(), 1);
    return SQLITE_OK;
  }

  /// Returns SQLITE_ROW while more may follow, SQLITE_DONE with the last batch.
  int read(std::vector<PowerLogEvent>& events) {
    events.clear();
    auto row = prepare(_database, kEvents);
    if (!row) return sqlite3_errcode(_database);
    sqlite3_bind_int64(row.get(), 1, _next);
    sqlite3_bind_int64(row.get(), 2, _last);
    sqlite3_bind_double(row.get(), 3, _since);
    int result = SQLITE_ROW;
    std::size_t bytes = 0;
    while (events.size() < kBatchEvents && bytes < kBatchBytes) {
      result = sqlite3_step(row.get());
      if (result != SQLITE_ROW) break;
      events.push_back(eventIn(row.get()));
      bytes += events.back().dictionary.size();
      _next = sqlite3_column_int64(row.get(), 4) + 1;
    }
    return result;
  }

 private:
  sqlite3* _database;
  double _since;
  std::int64_t _next = 0;
  std::int64_t _last = 0;
};

}  // namespace

Result<void> readPowerLog(const std::string& path, WallTime since,
                          const std::function<bool(const PowerLogEvent& event)>& take) {
  sqlite3* opened = nullptr;
  const auto failure = [&opened] { return Error{Error::Kind::Failed, sqlite3_errmsg(opened)}; };
  int result = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
  SQLiteDatabase database(opened);
  if (result != SQLITE_OK) return failure();
  sqlite3_busy_timeout(opened, kBusyMilliseconds);
  Batches batches(opened, std::chrono::duration<double>(since.time_since_epoch()).count());
  std::vector<PowerLogEvent> events;
  result = batches.begin();
  if (result == SQLITE_OK) result = SQLITE_ROW;
  while (result == SQLITE_ROW) {
    result = batches.read(events);
    for (const PowerLogEvent& event : events) {
      if (!take(event)) return {};
    }
  }
  if (result != SQLITE_DONE) return failure();
  return {};
}

}  // namespace vesk
