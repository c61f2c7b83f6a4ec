#include "platform/outbox/OutboxStore.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <zlib.h>

#include <algorithm>
#include <filesystem>
#include <optional>
#include <set>
#include <system_error>

#include "platform/files/FileDescriptor.h"
#include "platform/http/HTTPExchange.h"

namespace vesk {

namespace {

constexpr std::size_t kRowOverhead = 128;

// The lock is kept as long as the database is open, also over transactions.
constexpr char kSetUp[] =
    "PRAGMA locking_mode=EXCLUSIVE;"
    "PRAGMA auto_vacuum=INCREMENTAL;"
    "PRAGMA journal_mode=WAL;"
    "PRAGMA synchronous=FULL;"
    "PRAGMA secure_delete=ON;"
    "PRAGMA temp_store=MEMORY;"
    "PRAGMA cache_size=-512;"
    "PRAGMA journal_size_limit=1048576;"
    "BEGIN IMMEDIATE;"
    "CREATE TABLE IF NOT EXISTS posts(id INTEGER PRIMARY KEY, host TEXT NOT NULL, owner INTEGER NOT NULL,"
    " source TEXT NOT NULL, events INTEGER NOT NULL, respects_consent INTEGER NOT NULL, kept INTEGER NOT "
    "NULL,"
    " not_before INTEGER NOT NULL, size INTEGER NOT NULL, checksum INTEGER NOT NULL, url TEXT NOT NULL,"
    " headers TEXT NOT NULL, body BLOB NOT NULL);"
    "CREATE INDEX IF NOT EXISTS posts_host ON posts(host, id);"
    "CREATE INDEX IF NOT EXISTS posts_owner ON posts(owner, id);"
    "COMMIT;";

constexpr char kInsert[] =
    "INSERT INTO posts(id, host, owner, source, events, respects_consent, kept, not_before, size, checksum,"
    " url, headers, body) VALUES(?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13)";

// A post that must wait for longer than any wait lasts was dated while the clock was wrong.
#define VESK_POST_COLUMNS \
  "id, owner, source, events, respects_consent, kept, not_before, checksum, url, headers, body"
constexpr char kSelect[] =
    "SELECT " VESK_POST_COLUMNS
    " FROM posts WHERE host = ?1 AND id > ?2 AND (not_before <= ?3 OR not_before > ?3 + 60000000)"
    " ORDER BY id LIMIT ?4";

void bindText(sqlite3_stmt* statement, int index, std::string_view text) {
  sqlite3_bind_text64(statement, index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
}

std::string_view textAt(sqlite3_stmt* statement, int column) {
  const auto* text = static_cast<const char*>(sqlite3_column_blob(statement, column));
  const auto size = static_cast<std::size_t>(sqlite3_column_bytes(statement, column));
  return text ? std::string_view(text, size) : std::string_view();
}

std::int64_t microseconds(WallTime time) { return time.time_since_epoch().count(); }
WallTime timeAt(sqlite3_stmt* statement, int column) {
  return WallTime(std::chrono::microseconds(sqlite3_column_int64(statement, column)));
}

// Names and values hold no control characters.
std::string textOfHeaders(const HTTPRequest& request) {
  std::string text;
  for (const auto& [name, value] : request.headers) text.append(name).append(":").append(value).append("\n");
  return text;
}

std::vector<std::pair<std::string, std::string>> headersFrom(std::string_view text) {
  std::vector<std::pair<std::string, std::string>> headers;
  while (!text.empty()) {
    const auto line = text.substr(0, text.find('\n'));
    const auto colon = line.find(':');
    if (colon != line.npos) headers.emplace_back(line.substr(0, colon), line.substr(colon + 1));
    text.remove_prefix(std::min(line.size() + 1, text.size()));
  }
  return headers;
}

// The database does not notice a changed byte inside a body.
std::int64_t checksum(std::string_view url, std::string_view headers, std::string_view body) {
  unsigned long sum = crc32(0, nullptr, 0);
  for (auto part : {url, headers, body}) {
    sum = crc32_z(sum, reinterpret_cast<const Bytef*>(part.data()), part.size());
  }
  return static_cast<std::int64_t>(sum);
}

/// Returns nullopt for a damaged row.
std::optional<WaitingPost> postAt(sqlite3_stmt* row) {
  const auto url = textAt(row, 8), headers = textAt(row, 9), body = textAt(row, 10);
  if (sqlite3_column_int64(row, 7) != checksum(url, headers, body)) return std::nullopt;
  WaitingPost post{
      .id = sqlite3_column_int64(row, 0), .request = {}, .kept = timeAt(row, 5), .notBefore = timeAt(row, 6)};
  post.request.method = "POST";
  post.request.url = url;
  post.request.headers = headersFrom(headers);
  post.request.body = body;
  post.request.owner = static_cast<std::uint32_t>(sqlite3_column_int64(row, 1));
  post.request.source = textAt(row, 2);
  post.request.events = static_cast<std::uint32_t>(sqlite3_column_int64(row, 3));
  post.request.respectsConsent = sqlite3_column_int(row, 4) != 0;
  return post;
}

/// The posts' numbers, from the table and its indexes, each read from both ends up to the first damaged page.
std::set<std::int64_t> findIDs(sqlite3* database) {
  std::set<std::int64_t> ids;
  for (const char* scan :
       {"NOT INDEXED ORDER BY id", "NOT INDEXED ORDER BY id DESC", "INDEXED BY posts_host ORDER BY host, id",
        "INDEXED BY posts_host ORDER BY host DESC, id DESC", "INDEXED BY posts_owner ORDER BY owner, id",
        "INDEXED BY posts_owner ORDER BY owner DESC, id DESC"}) {
    auto row = prepare(database, (std::string("SELECT id FROM posts ") + scan).c_str());
    while (row && sqlite3_step(row.get()) == SQLITE_ROW) ids.insert(sqlite3_column_int64(row.get(), 0));
  }
  return ids;
}

SQLiteDatabase open(const std::string& path, int& result) {
  sqlite3* database = nullptr;
  result = sqlite3_open_v2(path.c_str(), &database,
                           SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
  return SQLiteDatabase(database);
}

void createPrivately(const std::string& path) {
  std::error_code ignored;
  const auto directory = std::filesystem::path(path).parent_path();
  std::filesystem::create_directories(directory.parent_path(), ignored);
  ::mkdir(directory.c_str(), 0700);
  // SQLite gives its log the mode of the database.
  const FileDescriptor created(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
}

}  // namespace

OutboxStoreError::OutboxStoreError(int sqliteCode, const char* text)
    : std::runtime_error(text), _code(sqliteCode & 0xff) {}
bool OutboxStoreError::isDamage() const { return _code == SQLITE_CORRUPT || _code == SQLITE_NOTADB; }
bool OutboxStoreError::isFull() const { return _code == SQLITE_FULL; }
bool OutboxStoreError::isInUse() const { return _code == SQLITE_BUSY || _code == SQLITE_LOCKED; }

OutboxStore::OutboxStore(const std::string& path) {
  if (!path.empty()) createPrivately(path);
  int result = SQLITE_OK;
  _database = open(path.empty() ? ":memory:" : path, result);
  check(result);
  execute(kSetUp);
  readTotals();
}

void OutboxStore::salvage(const std::string& path, const std::function<void(const WaitingPost&)>& take) {
  int result = SQLITE_OK;
  const auto database = open(path, result);
  if (result != SQLITE_OK) return;
  sqlite3_exec(database.get(), "PRAGMA locking_mode=EXCLUSIVE", nullptr, nullptr, nullptr);
  for (std::int64_t id : findIDs(database.get())) {
    auto row = prepare(database.get(), "SELECT " VESK_POST_COLUMNS " FROM posts NOT INDEXED WHERE id = ?1");
    if (!row) return;
    sqlite3_bind_int64(row.get(), 1, id);
    if (sqlite3_step(row.get()) != SQLITE_ROW) continue;
    if (const auto post = postAt(row.get())) take(*post);
  }
}

void OutboxStore::begin() { execute("BEGIN IMMEDIATE"); }
void OutboxStore::commit() { execute("COMMIT"); }
void OutboxStore::rollBack() noexcept {
  sqlite3_exec(_database.get(), "ROLLBACK", nullptr, nullptr, nullptr);
  try {
    readTotals();
  } catch (const OutboxStoreError&) {
    // The next operation fails in the same way.
  }
}

void OutboxStore::add(const WaitingPost& post) {
  const HTTPRequest& request = post.request;
  const std::string headers = textOfHeaders(request);
  const auto host = hostOfURL(request.url);
  const auto size = static_cast<std::int64_t>(sizeOf(request));
  auto row = statement(kInsert);
  sqlite3_bind_int64(row.get(), 1, post.id);
  bindText(row.get(), 2, host);
  sqlite3_bind_int64(row.get(), 3, request.owner);
  bindText(row.get(), 4, request.source);
  sqlite3_bind_int64(row.get(), 5, request.events);
  sqlite3_bind_int(row.get(), 6, request.respectsConsent ? 1 : 0);
  sqlite3_bind_int64(row.get(), 7, microseconds(post.kept));
  sqlite3_bind_int64(row.get(), 8, microseconds(post.notBefore));
  sqlite3_bind_int64(row.get(), 9, size);
  sqlite3_bind_int64(row.get(), 10, checksum(request.url, headers, request.body));
  bindText(row.get(), 11, request.url);
  bindText(row.get(), 12, headers);
  sqlite3_bind_blob64(row.get(), 13, request.body.data(), request.body.size(), SQLITE_STATIC);
  step(row.get());
  _bytes += sizeOf(request);
  _events += request.events;
  _bytesByOwner[request.owner] += sizeOf(request);
  ++_countByHost[std::string(host)];
  _lastID = std::max(_lastID, post.id);
}

void OutboxStore::remove(std::int64_t id) { removeWhere("id = ?1", id); }

void OutboxStore::postpone(std::int64_t id, WallTime notBefore) {
  auto update = statement("UPDATE posts SET not_before = ?2 WHERE id = ?1");
  sqlite3_bind_int64(update.get(), 1, id);
  sqlite3_bind_int64(update.get(), 2, microseconds(notBefore));
  step(update.get());
}

bool OutboxStore::removeOneOfTheFullest(std::uint32_t owner, std::uint64_t bytes, Losses& lost) {
  auto fullest = std::max_element(_bytesByOwner.begin(), _bytesByOwner.end(),
                                  [](const auto& a, const auto& b) { return a.second < b.second; });
  if (fullest == _bytesByOwner.end() || fullest->second == 0) return false;
  const auto own = _bytesByOwner.find(owner);
  const std::uint64_t wanted = bytes + (own == _bytesByOwner.end() ? 0 : own->second);
  if (fullest != own && wanted > fullest->second) {
    if (own == _bytesByOwner.end()) return false;
    fullest = own;
  }
  auto removed = removeWhere("id = (SELECT min(id) FROM posts WHERE owner = ?1)", fullest->first);
  lost.insert(lost.end(), removed.begin(), removed.end());
  return !removed.empty();
}

OutboxStore::Losses OutboxStore::removeKeptBefore(WallTime time) {
  return removeWhere("kept < ?1", microseconds(time));
}

OutboxStore::Losses OutboxStore::removeRespectingConsent() {
  Losses lost = removeWhere("respects_consent = ?1", 1);
  if (!lost.empty()) execute("PRAGMA wal_checkpoint(TRUNCATE)");
  return lost;
}

void OutboxStore::redate(WallTime time, WallTime now) {
  auto update = statement("UPDATE posts SET kept = ?2 WHERE kept < ?1");
  sqlite3_bind_int64(update.get(), 1, microseconds(time));
  sqlite3_bind_int64(update.get(), 2, microseconds(now));
  step(update.get());
}

std::vector<WaitingPost> OutboxStore::posts(std::string_view host, std::int64_t id, std::size_t count,
                                            std::size_t bytes, WallTime now, Losses& damaged) {
  std::vector<WaitingPost> posts;
  std::vector<std::int64_t> unreadable;
  std::size_t total = 0;
  {
    auto row = statement(kSelect);
    bindText(row.get(), 1, host);
    sqlite3_bind_int64(row.get(), 2, id);
    sqlite3_bind_int64(row.get(), 3, microseconds(now));
    sqlite3_bind_int64(row.get(), 4, static_cast<std::int64_t>(count));
    while (total < bytes && step(row.get())) {
      auto post = postAt(row.get());
      if (!post) {
        unreadable.push_back(sqlite3_column_int64(row.get(), 0));
        continue;
      }
      total += sizeOf(post->request);
      posts.push_back(std::move(*post));
    }
  }
  for (std::int64_t each : unreadable) {
    auto removed = removeWhere("id = ?1", each);
    damaged.insert(damaged.end(), removed.begin(), removed.end());
  }
  return posts;
}

void OutboxStore::shrink() {
  execute("PRAGMA incremental_vacuum");
  execute("PRAGMA wal_checkpoint(TRUNCATE)");
}

std::uint64_t OutboxStore::sizeOf(const HTTPRequest& request) {
  std::uint64_t size = kRowOverhead + request.url.size() + request.body.size();
  for (const auto& [name, value] : request.headers) size += name.size() + value.size() + 2;
  return size;
}

OutboxStore::Losses OutboxStore::removeWhere(const std::string& condition, std::int64_t parameter) {
  const std::string text =
      "DELETE FROM posts WHERE " + condition + " RETURNING host, owner, source, events, size";
  auto removal = statement(text.c_str());
  sqlite3_bind_int64(removal.get(), 1, parameter);
  Losses lost;
  while (step(removal.get())) {
    const auto host = _countByHost.find(textAt(removal.get(), 0));
    if (host != _countByHost.end() && --host->second == 0) _countByHost.erase(host);
    const auto size = static_cast<std::uint64_t>(sqlite3_column_int64(removal.get(), 4));
    _bytes -= size;
    const auto owner = _bytesByOwner.find(static_cast<std::uint32_t>(sqlite3_column_int64(removal.get(), 1)));
    if (owner != _bytesByOwner.end() && (owner->second -= size) == 0) _bytesByOwner.erase(owner);
    const auto events = static_cast<std::uint64_t>(sqlite3_column_int64(removal.get(), 3));
    _events -= events;
    lost.push_back({std::string(textAt(removal.get(), 2)), events});
  }
  return lost;
}

void OutboxStore::readTotals() {
  _bytes = _events = 0;
  _bytesByOwner.clear();
  _countByHost.clear();
  auto row = statement(
      "SELECT host, owner, count(*), sum(size), max(id), sum(events) FROM posts GROUP BY host, owner");
  while (step(row.get())) {
    const auto size = static_cast<std::uint64_t>(sqlite3_column_int64(row.get(), 3));
    _countByHost[std::string(textAt(row.get(), 0))] +=
        static_cast<std::uint64_t>(sqlite3_column_int64(row.get(), 2));
    _bytesByOwner[static_cast<std::uint32_t>(sqlite3_column_int64(row.get(), 1))] += size;
    _bytes += size;
    _events += static_cast<std::uint64_t>(sqlite3_column_int64(row.get(), 5));
    _lastID = std::max<std::int64_t>(_lastID, sqlite3_column_int64(row.get(), 4));
  }
}

SQLiteStatement OutboxStore::statement(const char* text) {
  auto prepared = prepare(_database.get(), text);
  if (!prepared) fail();
  return prepared;
}

void OutboxStore::execute(const char* text) {
  check(sqlite3_exec(_database.get(), text, nullptr, nullptr, nullptr));
}

/// Returns true if there is a row.
bool OutboxStore::step(sqlite3_stmt* statement) {
  const int result = sqlite3_step(statement);
  if (result != SQLITE_ROW && result != SQLITE_DONE) fail();
  return result == SQLITE_ROW;
}

void OutboxStore::check(int result) {
  if (result != SQLITE_OK) fail();
}

void OutboxStore::fail() {
  throw OutboxStoreError(sqlite3_errcode(_database.get()), sqlite3_errmsg(_database.get()));
}

}  // namespace vesk
