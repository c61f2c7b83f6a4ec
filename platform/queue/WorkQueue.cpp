#include "platform/queue/WorkQueue.h"

#include <pthread.h>
#include <signal.h>

#include <algorithm>
#include <atomic>
#include <boost/asio/bind_executor.hpp>
#include <boost/asio/executor_work_guard.hpp>
#include <boost/asio/io_context.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/post.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/asio/strand.hpp>
#include <exception>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "platform/log/LogUser.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"

namespace vesk {

namespace {

namespace asio = boost::asio;
using Strand = asio::strand<asio::io_context::executor_type>;

void run(const Work& work, const char* label) noexcept {
  try {
    work();
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("%s: work failed: %s", label, error.what());
  } catch (...) {
    VESK_LOG_ERROR("%s: work failed", label);
  }
}

}  // namespace

/// What a timer and a read source have in common: a handler that can be taken away at any time.
class WorkQueuePool::Source {
 public:
  Source(Core& core, const char* label, Work handler)
      : _core(core), _label(label), _handler(std::make_shared<const Work>(std::move(handler))) {}
  virtual ~Source() = default;
  Source(const Source&) = delete;
  Source& operator=(const Source&) = delete;

  /// Runs the handler unless it was taken away; whether it is still there afterwards.
  bool call() noexcept {
    LogUser onBehalfOf(_user);
    if (auto handler = current()) run(*handler, _label);
    return current() != nullptr;
  }
  void dropHandler() noexcept {
    std::shared_ptr<const Work> dropped;  // destroyed last, without the lock
    MutexLock lock(_mutex);
    dropped.swap(_handler);
  }
  /// Has the queue forget about it, after the handler was dropped.
  virtual void shut() = 0;

 protected:
  Core& _core;
  const char* const _label;

 private:
  const std::uint32_t _user = LogUser::current();  // of its maker

  std::shared_ptr<const Work> current() {
    MutexLock lock(_mutex);
    return _handler;
  }

  Mutex _mutex;
  std::shared_ptr<const Work> _handler VESK_GUARDED_BY(_mutex);
};

/// Lives as long as the pool and whatever refers to it. What waits in the context refers to it by address
/// only, since it is destroyed with the context at the latest.
class WorkQueuePool::Core {
 public:
  explicit Core(std::size_t threads) : _guard(_context.get_executor()) {
    try {
      for (std::size_t i = 0; i < threads; ++i) _threads.emplace_back([this] { serve(); });
    } catch (...) {
      stop();
      throw;
    }
  }
  ~Core() { stop(); }

  asio::io_context& context() noexcept { return _context; }

  /// Puts `work` into a queue unless the pool was stopped.
  template <class Function>
  void post(const Strand& strand, Function work) {
    MutexLock lock(_mutex);
    if (_stopped) return;
    asio::post(strand, [this, work = std::move(work)]() mutable {
      if (!_discarding) work();
    });
  }

  /// For those whose handlers are to be destroyed when the pool is stopped, or at once when it was: work that
  /// ran at that moment may make some.
  void add(const std::shared_ptr<Source>& source) {
    if (!remember(source)) source->dropHandler();
  }

  void stop() noexcept;

 private:
  bool remember(const std::shared_ptr<Source>& source) {
    MutexLock lock(_mutex);
    if (_stopped) return false;
    if (_sources.size() >= _pruneAt) {
      std::erase_if(_sources, [](const auto& known) { return known.expired(); });
      _pruneAt = 2 * _sources.size() + 16;
    }
    _sources.push_back(source);
    return true;
  }
  void serve() noexcept {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, nullptr);  // signals are for the main thread
    pthread_setname_np(pthread_self(), "queue");
    _context.run();
  }

  Mutex _mutex;
  bool _stopped VESK_GUARDED_BY(_mutex) = false;
  std::vector<std::weak_ptr<Source>> _sources VESK_GUARDED_BY(_mutex);
  std::size_t _pruneAt VESK_GUARDED_BY(_mutex) = 16;
  std::atomic<bool> _discarding{false};
  asio::io_context _context;
  asio::executor_work_guard<asio::io_context::executor_type> _guard;
  std::vector<std::thread> _threads;
};

void WorkQueuePool::Core::stop() noexcept {
  std::vector<std::weak_ptr<Source>> sources;
  {
    MutexLock lock(_mutex);
    if (_stopped) return;
    _stopped = _discarding = true;
    sources.swap(_sources);
  }
  _context.stop();
  for (auto& thread : _threads) thread.join();
  _threads.clear();
  for (const auto& known : sources) {
    if (auto source = known.lock()) source->dropHandler();
  }
  // Work that waits may hold queues, and with them this core: it goes now, not with the core.
  _guard.reset();
  _context.restart();
  _context.poll();
}

struct WorkQueue::State {
  State(std::shared_ptr<WorkQueuePool::Core> pool, const char* queueLabel)
      : core(std::move(pool)), label(queueLabel), strand(asio::make_strand(core->context())) {}
  std::shared_ptr<WorkQueuePool::Core> core;
  const char* const label;
  Strand strand;
};

WorkQueuePool::WorkQueuePool(std::size_t threads)
    : _core(std::make_shared<Core>(std::max<std::size_t>(threads, 1))) {}
WorkQueuePool::~WorkQueuePool() { stop(); }
void WorkQueuePool::stop() { _core->stop(); }

WorkQueue::WorkQueue(WorkQueuePool& pool, const char* label)
    : _state(std::make_shared<State>(pool._core, label)) {}

void WorkQueue::submit(Work work) {
  _state->core->post(_state->strand,
                     [work = std::move(work), label = _state->label, user = LogUser::current()] {
                       LogUser onBehalfOf(user);
                       run(work, label);
                     });
}

/// Only its queue touches the timer of the context.
class WorkQueuePool::Timer : public Source, public std::enable_shared_from_this<Timer> {
 public:
  using Clock = std::chrono::steady_clock;

  Timer(Core& core, const char* label, Strand strand, std::chrono::milliseconds interval, Work handler)
      : Source(core, label, std::move(handler)),
        _interval(interval),
        _strand(std::move(strand)),
        _timer(core.context()) {}

  void start(std::chrono::milliseconds first) {
    _core.add(shared_from_this());
    auto expiry = Clock::now() + first;
    _core.post(_strand, [self = shared_from_this(), expiry] { self->arm(expiry); });
  }
  void shut() override {
    _core.post(_strand, [self = shared_from_this()] { self->_timer.cancel(); });
  }

 private:
  void arm(Clock::time_point expiry) {
    _timer.expires_at(expiry);
    _timer.async_wait(asio::bind_executor(
        _strand, [self = shared_from_this()](boost::system::error_code error) { self->fire(error); }));
  }
  void fire(boost::system::error_code error) {
    if (error || !call() || _interval == _interval.zero()) return;
    arm(std::max(_timer.expiry() + _interval, Clock::now()));
  }

  const std::chrono::milliseconds _interval;
  Strand _strand;
  asio::steady_timer _timer;
};

/// Only its queue touches the descriptor of the context.
class WorkQueuePool::Watch : public Source, public std::enable_shared_from_this<Watch> {
 public:
  Watch(Core& core, const char* label, Strand strand, std::shared_ptr<const FileDescriptor> descriptor,
        Work handler)
      : Source(core, label, std::move(handler)),
        _strand(std::move(strand)),
        _owner(std::move(descriptor)),
        _descriptor(core.context()) {
    boost::system::error_code error;
    _descriptor.assign(_owner->get(), error);
    if (error) throw std::system_error(error, "read source");
  }
  ~Watch() override { letGo(); }

  void start() {
    _core.add(shared_from_this());
    _core.post(_strand, [self = shared_from_this()] { self->wait(); });
  }
  void shut() override {
    _core.post(_strand, [self = shared_from_this()] { self->letGo(); });
  }

 private:
  void wait() {
    _descriptor.async_wait(
        asio::posix::stream_descriptor::wait_read,
        asio::bind_executor(_strand, [self = shared_from_this()](boost::system::error_code error) {
          if (!error && self->call()) self->wait();
        }));
  }

  /// Stops watching before the descriptor may be closed.
  void letGo() {
    if (_owner) _descriptor.release();
    _owner.reset();
  }

  Strand _strand;
  std::shared_ptr<const FileDescriptor> _owner;
  asio::posix::stream_descriptor _descriptor;
};

void WorkQueue::submitAfter(std::chrono::milliseconds delay, Work work) {
  // The context holds it until it has fired.
  std::make_shared<WorkQueuePool::Timer>(*_state->core, _state->label, _state->strand,
                                         std::chrono::milliseconds::zero(), std::move(work))
      ->start(delay);
}

WorkSource::WorkSource(const WorkQueue& queue) : _core(queue._state->core) {}

WorkSource& WorkSource::operator=(WorkSource&& other) noexcept {
  if (this == &other) return *this;
  cancel();
  _source = std::move(other._source);
  _core = std::move(other._core);
  return *this;
}

void WorkSource::cancel() noexcept {
  auto source = std::move(_source);
  if (!source) return;
  source->dropHandler();
  try {
    source->shut();
  } catch (const std::exception& error) {
    // For want of memory. It finds that it has no handler when it fires.
    VESK_LOG_ERROR("WorkQueue: %s", error.what());
  }
}

WorkTimer::WorkTimer(const WorkQueue& queue, std::chrono::milliseconds first,
                     std::chrono::milliseconds interval, Work handler)
    : WorkSource(queue) {
  auto timer = std::make_shared<WorkQueuePool::Timer>(*queue._state->core, queue._state->label,
                                                      queue._state->strand, interval, std::move(handler));
  _source = timer;
  timer->start(first);
}

ReadSource::ReadSource(const WorkQueue& queue, std::shared_ptr<const FileDescriptor> descriptor, Work handler)
    : WorkSource(queue) {
  auto watch =
      std::make_shared<WorkQueuePool::Watch>(*queue._state->core, queue._state->label, queue._state->strand,
                                             std::move(descriptor), std::move(handler));
  _source = watch;
  watch->start();
}

}  // namespace vesk
