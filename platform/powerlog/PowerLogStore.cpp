#include "platform/powerlog/PowerLogStore.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>

#include "platform/files/FileLock.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr char kSetUp[] =
    "PRAGMA journal_mode=WAL;"
    "PRAGMA synchronous=NORMAL;"
    "PRAGMA temp_store=MEMORY;"
    "PRAGMA journal_size_limit=4194304;"
    "CREATE TABLE IF NOT EXISTS events(id INTEGER PRIMARY KEY AUTOINCREMENT, identifier INTEGER NOT NULL,"
    " name TEXT NOT NULL, time REAL NOT NULL, dictionary TEXT NOT NULL);"
    "CREATE INDEX IF NOT EXISTS events_time ON events(time);";

bool isDamage(int result) {
  int primary = result & 0xff;
  return primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB;
}

int execute(sqlite3* database, const char* statements) {
  return sqlite3_exec(database, statements, nullptr, nullptr, nullptr);
}

double secondsOf(WallTime time) { return std::chrono::duration<double>(time.time_since_epoch()).count(); }

int bindText(sqlite3_stmt* statement, int index, const std::string& text) {
  return sqlite3_bind_text64(statement, index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
}

}  // namespace

std::string PowerLogStore::append(const std::vector<PowerLogEvent>& events, const Moment& now) {
  // Another process may have begun the file anew, or somebody removed it.
  if (!(fileAtPath() == _opened)) {
    _database.reset();
    _checked = {};  // a new file may get the number of the old one
  }
  int result = openAndWrite(events, now);
  if (isDamage(result)) {
    const std::string damage = sqlite3_errstr(result);
    if (std::string problem = setAside(); !problem.empty()) {
      return damage + ", and it can't be moved: " + problem;
    }
    VESK_LOG_ERROR("PowerLog: %s is damaged (%s); it is kept as %s.corrupt", _path.c_str(), damage.c_str(),
                   _path.c_str());
    result = openAndWrite(events, now);
  }
  if (result == SQLITE_OK) return {};
  // Whatever it is may be over when the file is opened the next time.
  _database.reset();
  return sqlite3_errstr(result);
}

int PowerLogStore::openAndWrite(const std::vector<PowerLogEvent>& events, const Moment& now) {
  const int result = _database ? SQLITE_OK : open();
  return result == SQLITE_OK ? write(events, now) : result;
}

int PowerLogStore::open() {
  std::error_code ignored;
  std::filesystem::create_directories(std::filesystem::path(_path).parent_path(), ignored);
  sqlite3* database = nullptr;
  int result = sqlite3_open_v2(_path.c_str(), &database,
                               SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
  _database.reset(database);
  _opened = fileAtPath();
  if (result != SQLITE_OK) return result;
  // Of two processes that turn a new file to WAL at once, SQLite lets one fail without waiting.
  FileDescriptor lock;
  if (!lockOthersOut(lock)) return SQLITE_BUSY;
  sqlite3_extended_result_codes(database, 1);
  sqlite3_busy_timeout(database, static_cast<int>(_bounds.patience.count()));
  result = execute(database, kSetUp);
  if (result != SQLITE_OK) return result;
  _opened = fileAtPath();
  // Once: it reads the whole file, and what is damaged later shows where it is come upon.
  return _checked == _opened ? SQLITE_OK : check();
}

int PowerLogStore::check() {
  auto row = prepare(_database.get(), "PRAGMA quick_check(1)");
  const int result = row ? sqlite3_step(row.get()) : sqlite3_errcode(_database.get());
  if (result != SQLITE_ROW) return result;
  const auto* verdict = sqlite3_column_text(row.get(), 0);
  if (!verdict || std::string(reinterpret_cast<const char*>(verdict)) != "ok") return SQLITE_CORRUPT;
  _checked = _opened;
  _found = number("SELECT max(id) FROM events");
  _added.clear();
  return SQLITE_OK;
}

int PowerLogStore::write(const std::vector<PowerLogEvent>& events, const Moment& now) {
  int result = execute(_database.get(), "BEGIN IMMEDIATE");
  if (result == SQLITE_OK) result = insert(events);
  if (result == SQLITE_OK) result = prune(now);
  if (result == SQLITE_OK) result = execute(_database.get(), "COMMIT");
  if (result != SQLITE_OK) execute(_database.get(), "ROLLBACK");
  return result;
}

int PowerLogStore::insert(const std::vector<PowerLogEvent>& events) {
  auto row = prepare(_database.get(),
                     "INSERT INTO events(identifier, name, time, dictionary) VALUES(?1, ?2, ?3, ?4)");
  if (!row) return sqlite3_extended_errcode(_database.get());
  for (const PowerLogEvent& event : events) {
    sqlite3_bind_int64(row.get(), 1, event.identifier);
    bindText(row.get(), 2, event.name);
    sqlite3_bind_double(row.get(), 3, secondsOf(event.time));
    bindText(row.get(), 4, event.dictionary);
    int result = sqlite3_step(row.get());
    if (result != SQLITE_DONE) return result;
    sqlite3_reset(row.get());
  }
  return SQLITE_OK;
}

int PowerLogStore::dropAged(const Moment& now) {
  using std::chrono::hours;
  auto found = prepare(_database.get(), "DELETE FROM events WHERE time < ?1 AND id <= ?2");
  if (!found) return sqlite3_extended_errcode(_database.get());
  sqlite3_bind_double(found.get(), 1, secondsOf(now.wall - _bounds.age));
  sqlite3_bind_int64(found.get(), 2, _found);
  const int result = sqlite3_step(found.get());
  if (result != SQLITE_DONE) return result;

  _added[std::chrono::floor<hours>(now.uptime)] = number("SELECT max(id) FROM events");
  std::int64_t aged = 0;
  while (_added.begin()->first + hours(1) + _bounds.age <= now.uptime) {
    aged = _added.begin()->second;
    _added.erase(_added.begin());
  }
  return remove("DELETE FROM events WHERE id <= ?1", aged);
}

int PowerLogStore::prune(const Moment& now) {
  int result = dropAged(now);
  if (result != SQLITE_OK) return result;
  result = remove("DELETE FROM events WHERE id <= (SELECT max(id) FROM events) - ?1", _bounds.rows);
  if (result != SQLITE_OK) return result;
  const std::int64_t used =
      (number("PRAGMA page_count") - number("PRAGMA freelist_count")) * number("PRAGMA page_size");
  if (used <= _bounds.bytes) return SQLITE_OK;
  // Its pages are used again; a quarter at a time, so that this is seldom.
  return remove("DELETE FROM events WHERE id <= (SELECT min(id) + (max(id) - min(id)) / ?1 FROM events)", 4);
}

int PowerLogStore::remove(const char* statement, std::int64_t bound) {
  auto removal = prepare(_database.get(), statement);
  if (!removal) return sqlite3_extended_errcode(_database.get());
  sqlite3_bind_int64(removal.get(), 1, bound);
  int result = sqlite3_step(removal.get());
  return result == SQLITE_DONE ? SQLITE_OK : result;
}

std::int64_t PowerLogStore::number(const char* statement) {
  auto row = prepare(_database.get(), statement);
  if (!row || sqlite3_step(row.get()) != SQLITE_ROW) return 0;
  return sqlite3_column_int64(row.get(), 0);
}

bool PowerLogStore::lockOthersOut(FileDescriptor& lock) const {
  // Where no lock is to be had, there is nobody who could write to the file either.
  return lockFile(lock, _path + ".lock", _bounds.patience) != EWOULDBLOCK;
}

std::string PowerLogStore::setAside() {
  _database.reset();
  _checked = {};
  FileDescriptor lock;
  if (!lockOthersOut(lock)) return sqlite3_errstr(SQLITE_BUSY);
  // Another process may have found the same damage first.
  if (!(fileAtPath() == _opened)) return {};
  const std::string aside = _path + ".corrupt";
  if (std::rename(_path.c_str(), aside.c_str()) != 0) return std::generic_category().message(errno);
  ::unlink((_path + "-shm").c_str());
  std::string log = _path + "-wal";
  if (std::rename(log.c_str(), (aside + "-wal").c_str()) != 0) ::unlink((aside + "-wal").c_str());
  return {};
}

PowerLogStore::Identity PowerLogStore::fileAtPath() const {
  struct stat status {};
  if (::stat(_path.c_str(), &status) != 0) return {};
  return {status.st_dev, status.st_ino};
}

}  // namespace vesk
