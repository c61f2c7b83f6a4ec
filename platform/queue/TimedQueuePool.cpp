#include "platform/queue/TimedQueuePool.h"

#include <condition_variable>
#include <mutex>
#include <utility>

namespace vesk {

/// Outlives the pool as long as a queue does.
struct TimedQueuePool::Users {
  std::mutex mutex;
  std::condition_variable left;
  std::size_t count = 0;  // under mutex
};

class TimedQueuePool::Queue final : public TimedQueue {
 public:
  Queue(WorkQueuePool& pool, const char* label, std::shared_ptr<Users> users)
      : _queue(pool, label), _users(std::move(users)) {
    std::lock_guard lock(_users->mutex);
    ++_users->count;
  }
  ~Queue() override {
    std::lock_guard lock(_users->mutex);
    --_users->count;
    _users->left.notify_all();
  }
  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

  Clock::time_point now() const override { return Clock::now(); }
  void submit(Work work) override { _queue.submit(std::move(work)); }
  void submitAfter(std::chrono::milliseconds delay, Work work) override {
    _queue.submitAfter(delay, std::move(work));
  }
  std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first, std::chrono::milliseconds interval,
                                    Work handler) override {
    return std::make_unique<Held<WorkTimer>>(WorkTimer(_queue, first, interval, std::move(handler)));
  }
  std::unique_ptr<Source> makeReadSource(std::shared_ptr<const FileDescriptor> descriptor,
                                         Work handler) override {
    return std::make_unique<Held<ReadSource>>(ReadSource(_queue, std::move(descriptor), std::move(handler)));
  }

 private:
  template <class S>
  struct Held final : Source {
    explicit Held(S held) : source(std::move(held)) {}
    S source;
  };

  WorkQueue _queue;
  const std::shared_ptr<Users> _users;
};

TimedQueuePool::TimedQueuePool(std::size_t threads) : _threads(threads), _users(std::make_shared<Users>()) {}
TimedQueuePool::~TimedQueuePool() = default;

std::shared_ptr<TimedQueue> TimedQueuePool::makeQueue(const char* label) {
  return std::make_shared<Queue>(pool(), label, _users);
}

bool TimedQueuePool::waitUntilUnused(std::chrono::milliseconds timeout) {
  std::unique_lock lock(_users->mutex);
  return _users->left.wait_for(lock, timeout, [&] { return _users->count == 0; });
}

void TimedQueuePool::stop() {
  MutexLock lock(_mutex);
  if (_pool) _pool->stop();
}

WorkQueuePool& TimedQueuePool::pool() {
  MutexLock lock(_mutex);
  if (!_pool) _pool.emplace(_threads);
  return *_pool;  // stays where it is
}

}  // namespace vesk
