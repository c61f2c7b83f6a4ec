#include "platform/outbox/OutboxStorage.h"

#include <unistd.h>

#include <cstdio>
#include <limits>
#include <optional>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr std::chrono::seconds kFileRetry{60};
constexpr std::size_t kPostsAtOnce = 64;
constexpr std::size_t kBytesAtOnce = std::size_t{1} << 20;

// No device's clock is right and earlier than this: 2024-01-01.
constexpr WallTime kFirstPlausibleTime{std::chrono::seconds(1'704'067'200)};

}  // namespace

OutboxStorage::OutboxStorage(std::string path, Limits limits) : _path(std::move(path)), _limits(limits) {
  if (::access(_path.c_str(), F_OK) != 0) return;
  Lost lost;
  try {
    open();
  } catch (const OutboxStoreError& error) {
    handle(error, lost);
  }
}

void OutboxStorage::write(Changes& changes, Instant now, Lost& lost) {
  if (writeToFile(changes, now, lost)) {
    changes = {};
    return;
  }
  if (!_memory) _memory = std::make_unique<OutboxStore>("");
  apply(changes, *_memory, _limits.bytesInMemory, lost.overQuota);
  changes.added.clear();
  changes.postponed.clear();
  // What was removed may also be in the file.
  if (!_file) changes.removed.clear();
}

bool OutboxStorage::writeToFile(const Changes& changes, Instant now, Lost& lost) {
  if (now < _tryFileAgain) return false;
  for (int attempt = 0; attempt < 2; ++attempt) {
    try {
      if (!_file) open();
      Losses overQuota;
      _file->begin();
      copyMemoryTo(*_file, overQuota);
      apply(changes, *_file, _limits.bytes, overQuota);
      _file->commit();
      lost.overQuota.insert(lost.overQuota.end(), overQuota.begin(), overQuota.end());
      _memory.reset();
      _problem.clear();
      return true;
    } catch (const OutboxStoreError& error) {
      handle(error, lost);
      // A damaged file was moved aside, so a new one may do.
      if (!error.isDamage()) break;
    }
  }
  _tryFileAgain = now + kFileRetry;
  return false;
}

void OutboxStorage::apply(const Changes& changes, OutboxStore& store, std::uint64_t limit,
                          Losses& overQuota) {
  for (const WaitingPost& post : changes.added) add(post, store, limit, overQuota);
  for (const auto& [id, notBefore] : changes.postponed) store.postpone(id, notBefore);
  for (std::int64_t id : changes.removed) store.remove(id);
}

void OutboxStorage::add(const WaitingPost& post, OutboxStore& store, std::uint64_t limit, Losses& overQuota) {
  const std::uint64_t size = OutboxStore::sizeOf(post.request);
  bool fits = size <= limit;
  while (fits && store.bytes() + size > limit) {
    fits = store.removeOneOfTheFullest(post.request.owner, size, overQuota);
  }
  if (fits) {
    store.add(post);
  } else {
    overQuota.push_back({post.request.source, post.request.events});
  }
}

void OutboxStorage::copyMemoryTo(OutboxStore& file, Losses& overQuota) const {
  for (const auto& post : postsInMemory()) add(post, file, _limits.bytes, overQuota);
}

std::vector<WaitingPost> OutboxStorage::postsInMemory() const {
  constexpr auto kAll = std::numeric_limits<std::int64_t>::max();
  constexpr WallTime kAnyTime = WallTime::max() - std::chrono::hours(1);
  std::vector<WaitingPost> posts;
  if (!_memory) return posts;
  for (const auto& [host, count] : _memory->countByHost()) {
    Losses damaged;
    for (auto& post : _memory->posts(host, 0, count, kAll, kAnyTime, damaged))
      posts.push_back(std::move(post));
  }
  return posts;
}

OutboxStorage::Losses OutboxStorage::waitingInMemory() const {
  Losses lost;
  for (const auto& post : postsInMemory()) lost.push_back({post.request.source, post.request.events});
  return lost;
}

std::vector<WaitingPost> OutboxStorage::read(std::string_view host, std::int64_t id, WallTime now,
                                             Lost& lost) {
  std::vector<WaitingPost> posts;
  onEach(lost, [&](OutboxStore& store) {
    if (posts.empty()) posts = store.posts(host, id, kPostsAtOnce, kBytesAtOnce, now, lost.damaged);
  });
  return posts;
}

OutboxStorage::Losses OutboxStorage::removeKeptBefore(WallTime time, WallTime now, Lost& lost) {
  Losses removed;
  if (now < kFirstPlausibleTime) return removed;
  onEach(lost, [&](OutboxStore& store) {
    store.redate(kFirstPlausibleTime, now);
    for (auto& each : store.removeKeptBefore(time)) removed.push_back(std::move(each));
  });
  return removed;
}

OutboxStorage::Losses OutboxStorage::removeRespectingConsent(Lost& lost) {
  Losses removed;
  onEach(lost, [&](OutboxStore& store) {
    for (auto& each : store.removeRespectingConsent()) removed.push_back(std::move(each));
  });
  return removed;
}

void OutboxStorage::shrinkIfEmpty(Lost& lost) {
  onEach(lost, [](OutboxStore& store) {
    if (store.bytes() == 0) store.shrink();
  });
}

template <class Action>
void OutboxStorage::onEach(Lost& lost, Action action) {
  try {
    if (_file) action(*_file);
  } catch (const OutboxStoreError& error) {
    handle(error, lost);
  }
  if (_memory) action(*_memory);
}

std::map<std::string, std::uint64_t> OutboxStorage::countByHost() const {
  std::map<std::string, std::uint64_t> counts;
  for (const auto* store : {_file.get(), _memory.get()}) {
    if (!store) continue;
    for (const auto& [host, posts] : store->countByHost()) counts[host] += posts;
  }
  return counts;
}

std::uint64_t OutboxStorage::count() const {
  std::uint64_t count = 0;
  for (const auto& [host, posts] : countByHost()) count += posts;
  return count;
}

bool OutboxStorage::has(std::string_view host) const {
  const auto contains = [&](const auto& store) {
    return store && store->countByHost().find(host) != store->countByHost().end();
  };
  return contains(_file) || contains(_memory);
}

void OutboxStorage::open() { _file = std::make_unique<OutboxStore>(_path); }

void OutboxStorage::handle(const OutboxStoreError& error, Lost& lost) {
  if (error.isDamage()) {
    const std::uint64_t before = _file ? _file->events() : 0;
    const std::uint64_t saved = replaceDamaged(error.what());
    if (before > saved) lost.damaged.push_back({"outbox", before - saved});
    return;
  }
  if (_file) _file->rollBack();
  if (!error.isFull()) _file.reset();
  if (_problem == error.what()) return;
  _problem = error.what();
  VESK_LOG_ERROR("Outbox: %s; posts are kept in memory until %s can be used",
                 error.isInUse() ? "another process uses the file" : error.what(), _path.c_str());
}

std::uint64_t OutboxStorage::replaceDamaged(const char* problem) {
  _file.reset();
  const std::string aside = _path + ".damaged";
  for (const char* suffix : {"", "-wal"}) {
    const std::string from = _path + suffix, to = aside + suffix;
    ::unlink(to.c_str());
    if (std::rename(from.c_str(), to.c_str()) != 0) ::unlink(from.c_str());
  }
  std::uint64_t posts = 0;
  try {
    open();
    _file->begin();
    OutboxStore::salvage(aside, [&](const WaitingPost& post) {
      _file->add(post);
      ++posts;
    });
    _file->commit();
  } catch (const OutboxStoreError&) {
    // The new file shows the same problem at its next use.
    posts = 0;
    if (_file) _file->rollBack();
  }
  VESK_LOG_ERROR("Outbox: %s is damaged (%s); %llu posts could be read, and the file is kept as %s",
                 _path.c_str(), problem, static_cast<unsigned long long>(posts), aside.c_str());
  return _file ? _file->events() : 0;
}

}  // namespace vesk
