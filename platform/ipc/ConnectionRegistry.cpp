#include "platform/ipc/ConnectionRegistry.h"

namespace vesk {

ConnectionRegistry::Admission ConnectionRegistry::admit(uid_t user) {
  MutexLock lock(_mutex);
  if (_count >= (user == 0 ? _maximum : _maximumOfOthers)) return Admission::TooMany;
  auto& ofUser = _countOfUser[user];
  if (ofUser >= _maximumPerUser) return Admission::TooManyOfUser;
  ++ofUser;
  ++_count;
  return Admission::Admitted;
}

void ConnectionRegistry::release(uid_t user) noexcept {
  MutexLock lock(_mutex);
  auto ofUser = _countOfUser.find(user);
  if (ofUser == _countOfUser.end()) return;
  if (--ofUser->second == 0) _countOfUser.erase(ofUser);
  --_count;
}

std::size_t ConnectionRegistry::count() const {
  MutexLock lock(_mutex);
  return _count;
}

void ConnectionRegistry::add(std::uint64_t serial, std::weak_ptr<BusConnection> connection) {
  MutexLock lock(_mutex);
  _connections.emplace(serial, std::move(connection));
}

void ConnectionRegistry::remove(std::uint64_t serial) noexcept {
  MutexLock lock(_mutex);
  _connections.erase(serial);
}

std::vector<std::shared_ptr<BusConnection>> ConnectionRegistry::connections() const {
  std::vector<std::shared_ptr<BusConnection>> alive;
  MutexLock lock(_mutex);
  for (const auto& [serial, connection] : _connections) {
    if (auto held = connection.lock()) alive.push_back(std::move(held));
  }
  return alive;
}

void ConnectionRegistry::launch(std::function<void()> body) {
  MutexLock lock(_mutex);
  std::uint64_t number = ++_lastThread;
  // Holding the lock keeps the new thread from ending before it is listed.
  auto& place = _running[number];
  try {
    place = SmallThread("vesk-connection", [this, number, body = std::move(body)]() mutable {
      body();
      body = nullptr;  // what it holds goes before the thread counts as ended
      finish(number);
    });
  } catch (...) {
    _running.erase(number);
    throw;
  }
}

void ConnectionRegistry::finish(std::uint64_t thread) noexcept {
  MutexLock lock(_mutex);
  // Moving the node allocates nothing.
  _ended.insert(_running.extract(thread));
  if (_running.empty()) _noneRuns.notify_all();
  _threadEnded.signal();
}

void ConnectionRegistry::reap() {
  _threadEnded.clear();
  std::map<std::uint64_t, SmallThread> ended;
  {
    MutexLock lock(_mutex);
    ended.swap(_ended);
  }
}

bool ConnectionRegistry::waitForThreads(std::chrono::steady_clock::time_point deadline) {
  bool haveEnded = true;
  {
    MutexLock lock(_mutex);
    while (!_running.empty() && haveEnded) {
      haveEnded = _noneRuns.wait_until(_mutex, deadline) == std::cv_status::no_timeout;
    }
    haveEnded = _running.empty();
  }
  reap();
  return haveEnded;
}

}  // namespace vesk
