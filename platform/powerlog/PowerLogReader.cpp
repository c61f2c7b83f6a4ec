#include "platform/powerlog/PowerLogReader.h"

#include <cmath>

#include "platform/powerlog/SQLiteHandles.h"

namespace vesk {

namespace {

constexpr int kBusyMilliseconds = 5000;

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

}  // namespace

std::string readPowerLog(const std::string& path, WallTime since,
                         const std::function<bool(const PowerLogEvent& event)>& take) {
  sqlite3* opened = nullptr;
  int result = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
  SQLiteDatabase database(opened);
  if (result != SQLITE_OK) return sqlite3_errmsg(opened);
  sqlite3_busy_timeout(opened, kBusyMilliseconds);
  auto row =
      prepare(opened, "SELECT identifier, name, time, dictionary FROM events WHERE time >= ?1 ORDER BY id");
  if (!row) return sqlite3_errmsg(opened);
  sqlite3_bind_double(row.get(), 1, std::chrono::duration<double>(since.time_since_epoch()).count());
  while ((result = sqlite3_step(row.get())) == SQLITE_ROW) {
    if (!take(eventIn(row.get()))) return {};
  }
  return result == SQLITE_DONE ? std::string() : sqlite3_errmsg(opened);
}

}  // namespace vesk
