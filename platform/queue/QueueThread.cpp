#include "platform/queue/QueueThread.h"

#include <pthread.h>
#include <signal.h>

#include <algorithm>
#include <boost/asio/executor_work_guard.hpp>
#include <boost/asio/io_context.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/post.hpp>
#include <boost/asio/steady_timer.hpp>
#include <condition_variable>
#include <exception>
#include <system_error>
#include <thread>
#include <utility>

#include "platform/log/LogUser.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"

namespace vesk {

namespace {

namespace asio = boost::asio;
using Error = boost::system::error_code;

/// Work with the name of its queue and the user on whose behalf it runs.
struct Task {
  Work work;
  const char* label;
  std::uint32_t user = LogUser::current();

  void operator()() const noexcept {
    LogUser onBehalfOf(user);
    try {
      work();
    } catch (const std::exception& error) {
      VESK_LOG_ERROR("%s: work failed: %s", label, error.what());
    } catch (...) {
      VESK_LOG_ERROR("%s: work failed", label);
    }
  }
};

}  // namespace

/// The thread and its pending operations, which are destroyed with the context.
class QueueThread::Loop {
 public:
  Loop() : _guard(context.get_executor()), _thread([this] { serve(); }) {}
  ~Loop() {
    context.stop();
    _thread.join();
  }

  bool isCurrent() const { return std::this_thread::get_id() == _thread.get_id(); }

  asio::io_context context{1};

 private:
  void serve() noexcept {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, nullptr);  // signals are for the main thread
    pthread_setname_np(pthread_self(), "queue");
    context.run();
  }

  asio::executor_work_guard<asio::io_context::executor_type> _guard;
  std::thread _thread;
};

/// Outlives the thread while a queue exists. The lock is a leaf: it only guards putting things into the
/// context.
struct QueueThread::Shared {
  Mutex mutex;
  std::condition_variable_any released;
  std::size_t queues VESK_GUARDED_BY(mutex) = 0;
  bool isStopped VESK_GUARDED_BY(mutex) = false;
  std::unique_ptr<Loop> loop VESK_GUARDED_BY(mutex);
};

/// An operation in the context that calls a handler when it is ready. Only operations that wait in the
/// context hold it, so that it never outlives the context. Once it waits, only the thread accesses it.
class QueueThread::Waiter : public std::enable_shared_from_this<Waiter> {
 public:
  explicit Waiter(std::shared_ptr<const Task> task) : _task(std::move(task)) {}
  virtual ~Waiter() = default;

  virtual void wait() = 0;
  void cancel() {
    _task.reset();
    stopWaiting();
  }

 protected:
  virtual void stopWaiting() = 0;
  void ready(const Error& error) {
    const auto task = _task;  // it may cancel this
    if (error || !task) return;
    (*task)();
    if (_task) wait();
  }

 private:
  std::shared_ptr<const Task> _task;
};

class QueueThread::Timer final : public Waiter {
 public:
  Timer(asio::io_context& context, std::shared_ptr<const Task> task, std::chrono::milliseconds first,
        std::chrono::milliseconds interval)
      : Waiter(std::move(task)),
        _interval(interval),
        _next(TimedQueue::Clock::now() + first),
        _timer(context) {}

  void wait() override {
    _timer.expires_at(_next);
    _next = std::max(_next, TimedQueue::Clock::now()) + _interval;
    _timer.async_wait([this, self = shared_from_this()](const Error& error) { ready(error); });
  }

 private:
  void stopWaiting() override { _timer.cancel(); }

  const std::chrono::milliseconds _interval;
  TimedQueue::Clock::time_point _next;
  asio::steady_timer _timer;
};

class QueueThread::Watch final : public Waiter {
 public:
  Watch(asio::io_context& context, std::shared_ptr<const Task> task,
        std::shared_ptr<const FileDescriptor> descriptor)
      : Waiter(std::move(task)), _owner(std::move(descriptor)), _descriptor(context) {
    Error error;
    _descriptor.assign(_owner->get(), error);
    if (error) throw std::system_error(error, "read source");
  }
  ~Watch() override { stopWaiting(); }

  void wait() override {
    _descriptor.async_wait(asio::posix::stream_descriptor::wait_read,
                           [this, self = shared_from_this()](const Error& error) { ready(error); });
  }

 private:
  // Stops watching before the descriptor may be closed.
  void stopWaiting() override {
    if (_owner) _descriptor.release();
    _owner.reset();
  }

  std::shared_ptr<const FileDescriptor> _owner;
  asio::posix::stream_descriptor _descriptor;
};

/// Queues are serial and ordered because they share a single thread.
class QueueThread::Queue final : public TimedQueue {
 public:
  Queue(std::shared_ptr<Shared> shared, const char* label) : _shared(std::move(shared)), _label(label) {
    MutexLock lock(_shared->mutex);
    if (!_shared->loop && !_shared->isStopped) _shared->loop = std::make_unique<Loop>();
    ++_shared->queues;
  }
  ~Queue() override {
    MutexLock lock(_shared->mutex);
    --_shared->queues;
    _shared->released.notify_all();
  }
  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

  Clock::time_point now() const override { return Clock::now(); }

  void submit(Work work) override { post(*_shared, Task{std::move(work), _label}); }

  void submitAfter(std::chrono::milliseconds delay, Work work) override {
    Task task{std::move(work), _label};
    MutexLock lock(_shared->mutex);
    if (!_shared->loop) return;
    auto timer = std::make_shared<asio::steady_timer>(_shared->loop->context, delay);
    timer->async_wait([timer, task = std::move(task)](const Error&) { task(); });
  }

  std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first, std::chrono::milliseconds interval,
                                    Work handler) override {
    return make<Timer>(std::move(handler), first, interval);
  }

  std::unique_ptr<Source> makeReadSource(std::shared_ptr<const FileDescriptor> descriptor,
                                         Work handler) override {
    return make<Watch>(std::move(handler), std::move(descriptor));
  }

 private:
  struct Handle final : Source {
    Handle(std::shared_ptr<Shared> itsShared, std::weak_ptr<Waiter> itsWaiter)
        : shared(std::move(itsShared)), waiter(std::move(itsWaiter)) {}
    ~Handle() override {
      auto cancel = [waiter = std::move(waiter)] {
        if (auto held = waiter.lock()) held->cancel();
      };
      if (isCurrent()) {
        cancel();
      } else {
        post(*shared, std::move(cancel));
      }
    }
    bool isCurrent() const {
      MutexLock lock(shared->mutex);
      return shared->loop && shared->loop->isCurrent();
    }

    const std::shared_ptr<Shared> shared;
    std::weak_ptr<Waiter> waiter;
  };

  template <class Function>
  static void post(Shared& shared, Function function) {
    MutexLock lock(shared.mutex);
    if (shared.loop) asio::post(shared.loop->context, std::move(function));
  }

  template <class Kind, class... Arguments>
  std::unique_ptr<Source> make(Work handler, Arguments&&... arguments) {
    const auto task = std::make_shared<const Task>(Task{std::move(handler), _label});
    std::weak_ptr<Waiter> waiter;
    MutexLock lock(_shared->mutex);
    if (_shared->loop) {
      auto made = std::make_shared<Kind>(_shared->loop->context, task, std::forward<Arguments>(arguments)...);
      made->wait();
      waiter = made;
    }
    return std::make_unique<Handle>(_shared, std::move(waiter));
  }

  const std::shared_ptr<Shared> _shared;
  const char* const _label;
};

QueueThread::QueueThread() : _shared(std::make_shared<Shared>()) {}
QueueThread::~QueueThread() { stop(); }

std::shared_ptr<TimedQueue> QueueThread::makeQueue(const char* label) {
  return std::make_shared<Queue>(_shared, label);
}

bool QueueThread::waitUntilUnused(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  MutexLock lock(_shared->mutex);
  while (_shared->queues > 0) {
    if (_shared->released.wait_until(_shared->mutex, deadline) == std::cv_status::timeout) {
      return _shared->queues == 0;
    }
  }
  return true;
}

void QueueThread::stop() {
  std::unique_ptr<Loop> stopped;  // destroyed without the lock held
  MutexLock lock(_shared->mutex);
  _shared->isStopped = true;
  stopped.swap(_shared->loop);
}

}  // namespace vesk
