#include "platform/powerlog/PowerLogFile.h"

#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <system_error>

#include "platform/files/FileLock.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr std::chrono::seconds kMaxAge = std::chrono::days(7);
constexpr std::int64_t kMaxBytes = std::int64_t{64} << 20;  // of the database, roughly
constexpr std::chrono::milliseconds kPatience{5000};        // time to wait for another process that writes

constexpr char kSetUp[] =
    "PRAGMA journal_mode=WAL;"
    "PRAGMA synchronous=NORMAL;"
    "PRAGMA temp_store=MEMORY;"
    "PRAGMA journal_size_limit=4194304;"
    "CREATE TABLE IF NOT EXISTS events(id INTEGER PRIMARY KEY AUTOINCREMENT, identifier INTEGER NOT NULL,"
    " name TEXT NOT NULL, time REAL NOT NULL, dictionary TEXT NOT NULL);"
    "CREATE INDEX IF NOT EXISTS events_time ON events(time);";

constexpr char kInsert[] = "INSERT INTO events(identifier, name, time, dictionary) VALUES(?1, ?2, ?3, ?4)";

// Drops a quarter of a file that is too large. The freed pages are reused, so this is rare.
constexpr char kPrune[] =
    "DELETE FROM events WHERE time < ?1 OR id <= (SELECT max(id) - ?2 FROM events)"
    " OR id <= (SELECT (3 * (SELECT min(id) FROM events) + (SELECT max(id) FROM events)) / 4 WHERE ?3 <"
    " (SELECT (page_count - freelist_count) * page_size"
    " FROM pragma_page_count, pragma_freelist_count, pragma_page_size))";

int execute(sqlite3* database, const char* statements) {
  return sqlite3_exec(database, statements, nullptr, nullptr, nullptr);
}

double secondsOf(WallTime time) { return std::chrono::duration<double>(time.time_since_epoch()).count(); }

int bindText(sqlite3_stmt* statement, int index, const std::string& text) {
  return sqlite3_bind_text64(statement, index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
}

}  // namespace

Result<void> PowerLogFile::append(const std::vector<PowerLogEvent>& events, WallTime now) {
  int result = write(events, now);
  if (result == SQLITE_CORRUPT || result == SQLITE_NOTADB) {
    moveAside(result);
    result = write(events, now);
  }
  if (result == SQLITE_OK) return {};
  // Rolls back. The cause may be gone when the file is next opened.
  _database.reset();
  return Error{Error::Kind::Failed, sqlite3_errstr(result)};
}

int PowerLogFile::write(const std::vector<PowerLogEvent>& events, WallTime now) {
  int wasMoved = 0;
  if (_database) sqlite3_file_control(_database.get(), nullptr, SQLITE_FCNTL_HAS_MOVED, &wasMoved);
  if (wasMoved) _database.reset();
  int result = _database ? SQLITE_OK : open();
  if (result == SQLITE_OK) result = execute(_database.get(), "BEGIN IMMEDIATE");
  if (result == SQLITE_OK) result = insert(events);
  if (result == SQLITE_OK) result = prune(now);
  if (result == SQLITE_OK) result = execute(_database.get(), "COMMIT");
  return result;
}

int PowerLogFile::open() {
  std::error_code ignored;
  std::filesystem::create_directories(std::filesystem::path(_path).parent_path(), ignored);
  sqlite3* database = nullptr;
  const int result = sqlite3_open_v2(
      _path.c_str(), &database, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
  _database.reset(database);
  if (result != SQLITE_OK) return result;
  // If two processes switch a new file to WAL simultaneously, SQLite fails one of them without waiting.
  const auto lock = lockFile(_path + ".lock", kPatience);
  if (!lock && lock.error().kind == Error::Kind::Busy) return SQLITE_BUSY;
  sqlite3_busy_timeout(database, static_cast<int>(kPatience.count()));
  return execute(database, kSetUp);
}

int PowerLogFile::insert(const std::vector<PowerLogEvent>& events) {
  auto row = prepare(_database.get(), kInsert);
  for (const PowerLogEvent& event : events) {
    sqlite3_bind_int64(row.get(), 1, event.identifier);
    bindText(row.get(), 2, event.name);
    sqlite3_bind_double(row.get(), 3, secondsOf(event.time));
    bindText(row.get(), 4, event.dictionary);
    if (sqlite3_step(row.get()) != SQLITE_DONE) return sqlite3_errcode(_database.get());
    sqlite3_reset(row.get());
  }
  return SQLITE_OK;
}

int PowerLogFile::prune(WallTime now) {
  auto removal = prepare(_database.get(), kPrune);
  sqlite3_bind_double(removal.get(), 1, secondsOf(now - kMaxAge));
  sqlite3_bind_int64(removal.get(), 2, _maximumRows);
  sqlite3_bind_int64(removal.get(), 3, kMaxBytes);
  return sqlite3_step(removal.get()) == SQLITE_DONE ? SQLITE_OK : sqlite3_errcode(_database.get());
}

void PowerLogFile::moveAside(int damage) {
  _database.reset();
  const std::string aside = _path + ".corrupt";
  if (std::rename(_path.c_str(), aside.c_str()) != 0) return;
  VESK_LOG_ERROR("PowerLog: %s is damaged (%s); it is kept as %s", _path.c_str(), sqlite3_errstr(damage),
                 aside.c_str());
  ::unlink((_path + "-shm").c_str());
  if (std::rename((_path + "-wal").c_str(), (aside + "-wal").c_str()) != 0) {
    ::unlink((aside + "-wal").c_str());
  }
}

}  // namespace vesk
