// Mutexes that clang's thread-safety analysis understands (-Wthread-safety is an error in the clang build).
#pragma once

#include <mutex>

#if defined(__clang__)
#define VESK_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define VESK_THREAD_ANNOTATION(x)
#endif

#define VESK_CAPABILITY(x) VESK_THREAD_ANNOTATION(capability(x))
#define VESK_SCOPED_CAPABILITY VESK_THREAD_ANNOTATION(scoped_lockable)
#define VESK_GUARDED_BY(x) VESK_THREAD_ANNOTATION(guarded_by(x))
#define VESK_ACQUIRED_AFTER(...) VESK_THREAD_ANNOTATION(acquired_after(__VA_ARGS__))
#define VESK_REQUIRES(...) VESK_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define VESK_EXCLUDES(...) VESK_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))
#define VESK_ACQUIRE(...) VESK_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define VESK_RELEASE(...) VESK_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define VESK_NO_THREAD_SAFETY_ANALYSIS VESK_THREAD_ANNOTATION(no_thread_safety_analysis)
#define VESK_RETURNS_CAPABILITY(x) VESK_THREAD_ANNOTATION(lock_returned(x))

namespace vesk {

/// Use with std::condition_variable_any.
class VESK_CAPABILITY("mutex") Mutex {
 public:
  void lock() VESK_ACQUIRE() { _mutex.lock(); }
  void unlock() VESK_RELEASE() { _mutex.unlock(); }

 private:
  std::mutex _mutex;
};

/// A recursive mutex: the agent's monitor, which session operations re-enter.
class VESK_CAPABILITY("mutex") RecursiveMutex {
 public:
  void lock() VESK_ACQUIRE() { _mutex.lock(); }
  void unlock() VESK_RELEASE() { _mutex.unlock(); }

 private:
  std::recursive_mutex _mutex;
};

template <class M>
class VESK_SCOPED_CAPABILITY BasicLock {
 public:
  explicit BasicLock(M& mutex) VESK_ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~BasicLock() VESK_RELEASE() { _mutex.unlock(); }
  BasicLock(const BasicLock&) = delete;
  BasicLock& operator=(const BasicLock&) = delete;

 private:
  M& _mutex;
};

using MutexLock = BasicLock<Mutex>;
using RecursiveMutexLock = BasicLock<RecursiveMutex>;

}  // namespace vesk
