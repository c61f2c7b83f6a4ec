// A thread with a small stack. Private to platform/ipc.
#pragma once

#include <pthread.h>

#include <functional>

namespace vesk {

/// Joined by `join` or the destructor. std::thread gives no say in the size of the stack, and a thousand idle
/// connections should not reserve eight gigabytes.
class SmallThread {
 public:
  SmallThread() noexcept = default;
  /// `name`: at most 15 characters, a constant. `body` must not throw; it is destroyed on the thread. Throws
  /// std::system_error.
  SmallThread(const char* name, std::function<void()> body);
  SmallThread(SmallThread&& other) noexcept;
  SmallThread& operator=(SmallThread&& other) noexcept;
  ~SmallThread() { join(); }

  bool isJoinable() const noexcept { return _joinable; }
  void join() noexcept;

 private:
  pthread_t _thread{};
  bool _joinable = false;
};

}  // namespace vesk
