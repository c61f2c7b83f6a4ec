// Owns the thread of one session.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <thread>

#include "client/SessionWorker.h"

namespace vesk {

/// Runs a SessionWorker, of the process that made it and no other.
class SessionThread {
 public:
  /// Throws std::system_error or std::bad_alloc.
  explicit SessionThread(const ReportingOptions& options);
  /// Stops the worker and waits for its end; from the session's own thread, only stops it.
  ~SessionThread();
  SessionThread(const SessionThread&) = delete;
  SessionThread& operator=(const SessionThread&) = delete;

  /// False in a process forked from the one that made this: nothing here may be touched there.
  bool isOurs() const noexcept;
  bool isCurrent() const noexcept { return std::this_thread::get_id() == _thread.get_id(); }
  SessionWorker& worker() noexcept { return *_worker; }

 private:
  const std::uint64_t _mark;
  const std::chrono::milliseconds _drainTime;
  const std::shared_ptr<SessionWorker> _worker;
  std::thread _thread;
};

}  // namespace vesk
