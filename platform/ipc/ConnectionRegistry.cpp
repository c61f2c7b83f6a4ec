#include "platform/ipc/ConnectionRegistry.h"

#include <pthread.h>

#include <algorithm>
#include <system_error>

namespace vesk {

namespace {

constexpr std::size_t kKeptForRoot = 16;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define VESK_LARGE_FRAMES 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define VESK_LARGE_FRAMES 1
#endif
#endif

// Decoding a value nested to the limit and writing it as JSON takes about 100 KiB. std::thread doesn't let
// the size be set, and a thousand idle connections should not reserve eight gigabytes.
#ifdef VESK_LARGE_FRAMES
constexpr std::size_t kStackSize = std::size_t{4} << 20;
#else
constexpr std::size_t kStackSize = std::size_t{512} << 10;
#endif

void* run(void* argument) {
  std::unique_ptr<std::function<void()>> body(static_cast<std::function<void()>*>(argument));
  pthread_setname_np(pthread_self(), "vesk-connection");
  (*body)();
  return nullptr;
}

void startDetached(std::function<void()> body) {
  auto argument = std::make_unique<std::function<void()>>(std::move(body));
  pthread_attr_t attributes;
  pthread_t thread;
  int error = pthread_attr_init(&attributes);
  if (error == 0) {
    pthread_attr_setstacksize(&attributes, kStackSize);
    pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
    error = pthread_create(&thread, &attributes, run, argument.get());
    pthread_attr_destroy(&attributes);
  }
  if (error != 0) throw std::system_error(error, std::generic_category(), "A thread can't be started");
  static_cast<void>(argument.release());
}

}  // namespace

ConnectionRegistry::Admission ConnectionRegistry::admit(std::uint64_t serial, uid_t user) {
  const std::size_t kept = user == 0 ? 0 : std::min(kKeptForRoot, options.maximumConnections / 8);
  MutexLock lock(_mutex);
  if (_entries.size() >= options.maximumConnections - kept) return Admission::TooMany;
  auto isUsers = [user](const auto& entry) { return entry.second.user == user; };
  const auto ofUser = std::count_if(_entries.begin(), _entries.end(), isUsers);
  if (static_cast<std::size_t>(ofUser) >= options.maximumConnectionsPerUser) return Admission::TooManyOfUser;
  _entries.emplace(serial, Entry{user, {}});
  return Admission::Admitted;
}

void ConnectionRegistry::release(std::uint64_t serial) noexcept {
  MutexLock lock(_mutex);
  _entries.erase(serial);
}

std::size_t ConnectionRegistry::count() const {
  MutexLock lock(_mutex);
  return _entries.size();
}

void ConnectionRegistry::add(std::uint64_t serial, std::weak_ptr<BusConnection> connection) {
  MutexLock lock(_mutex);
  _entries.at(serial).connection = std::move(connection);
}

std::vector<std::shared_ptr<BusConnection>> ConnectionRegistry::connections() const {
  std::vector<std::shared_ptr<BusConnection>> alive;
  MutexLock lock(_mutex);
  for (const auto& [serial, entry] : _entries) {
    if (auto held = entry.connection.lock()) alive.push_back(std::move(held));
  }
  return alive;
}

void ConnectionRegistry::launch(std::function<void()> body) {
  {
    MutexLock lock(_mutex);
    ++_running;
  }
  try {
    startDetached([self = shared_from_this(), body = std::move(body)]() mutable {
      body();
      body = nullptr;  // destroyed before the thread counts as ended
      self->finish();
    });
  } catch (...) {
    finish();
    throw;
  }
}

void ConnectionRegistry::finish() noexcept {
  MutexLock lock(_mutex);
  if (--_running == 0) _noneRuns.notify_all();
}

bool ConnectionRegistry::waitForThreads(std::chrono::steady_clock::time_point deadline) {
  MutexLock lock(_mutex);
  while (_running > 0) {
    if (_noneRuns.wait_until(_mutex, deadline) == std::cv_status::timeout) return _running == 0;
  }
  return true;
}

}  // namespace vesk
