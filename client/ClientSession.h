// Passes a session's operations to its thread, and owns that thread.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <chrono>
#include <exception>
#include <memory>
#include <semaphore>
#include <thread>
#include <type_traits>
#include <utility>
#include <variant>

#include "client/BoundedWait.h"
#include "client/CallBuilding.h"
#include "client/ClientCall.h"
#include "client/ForkGuard.h"
#include "client/SessionWorker.h"

namespace vesk {

/// The three ways to post a call. `make` creates it on the caller's thread; an exception there becomes
/// OutOfResources. Thread-safe in the process that created the session; refused in any other process.
class ClientSession {
 public:
  using Timeout = std::chrono::milliseconds;

  /// Throws if memory, descriptors or threads are exhausted.
  explicit ClientSession(const ReportingOptions& options);
  /// Waits for the thread to end. On that thread, only tells it to end.
  ~ClientSession();
  ClientSession(const ClientSession&) = delete;
  ClientSession& operator=(const ClientSession&) = delete;

  /// Returns false in a process forked from the one that created this. Only `drops` may be called there.
  bool isOurs() const noexcept { return _process.isOurs(); }
  bool isConnected() const noexcept { return isOurs() && _worker->isConnected(); }
  ReportingDrops drops() const noexcept { return _worker->queue().drops(); }

  /// Posts a one-way call.
  template <class Make>
  ReportingStatus post(const Make& make) noexcept {
    if (!isOurs()) return ReportingStatus::ForkedProcess;
    try {
      return _worker->queue().push(make());
    } catch (const InvalidCall&) {
      _worker->queue().countDrop(Drop::Invalid);
      return ReportingStatus::InvalidArgument;
    } catch (...) {
      return ReportingStatus::OutOfResources;
    }
  }

  /// Posts a call whose answer goes to `callback`; one-way without a callback.
  template <class Answer, class Make>
  ReportingStatus ask(const Make& make, ReportingCallback<Answer> callback, Timeout timeout) noexcept {
    return post([&] {
      ClientCall call = make();
      call.deadline = deadlineAfter(timeout);
      if (callback) call.end = endFor<Answer>(std::move(callback));
      return call;
    });
  }

  /// Waits for the answer, up to a tenth of a second longer while a callback occupies the session's thread.
  template <class Answer, class Make>
  ReportingResult<Answer> wait(const Make& make, Timeout timeout) noexcept {
    // The session's thread knows best why there is no answer in time; this gives it a moment to report that.
    constexpr std::chrono::milliseconds kGrace{100};
    const auto outcome = [](ReportingStatus status) { return ReportingResult<Answer>{status, {}, {}}; };
    if (!isOurs()) return outcome(ReportingStatus::ForkedProcess);
    if (isSessionThread()) return outcome(ReportingStatus::OnSessionThread);
    try {
      const auto deadline = deadlineAfter(timeout) + kGrace;
      // Shared with the handler: the caller may be gone when the answer arrives.
      struct Waited {
        ReportingResult<Answer> result;
        std::binary_semaphore isThere{0};
      };
      auto waited = std::make_shared<Waited>();
      const auto keep = [waited](ReportingResult<Answer> result) {
        waited->result = std::move(result);
        waited->isThere.release();
      };
      const auto status = ask<Answer>(make, keep, timeout);
      if (status != ReportingStatus::Queued) return outcome(status);
      if (!waited->isThere.try_acquire_until(deadline)) return outcome(ReportingStatus::TimedOut);
      return std::move(waited->result);
    } catch (...) {
      return outcome(ReportingStatus::OutOfResources);
    }
  }

 private:
  static ClientCall::Time deadlineAfter(Timeout timeout) noexcept {
    return std::chrono::steady_clock::now() + boundedWait(timeout);
  }

  /// Converts the bus's answer to the result that `callback` gets.
  template <class Answer>
  static CallEnd endFor(ReportingCallback<Answer> callback) {
    return
        [callback = std::move(callback)](ReportingStatus status, BusAnswer* answer, std::string_view detail) {
          ReportingResult<Answer> result{status, {}, {}};
          try {
            result.detail = detail;
            if constexpr (!std::is_same_v<Answer, std::monostate>) {
              if (answer && !answer->read(result.answer)) {
                result.status = ReportingStatus::Refused;
                result.detail = "the daemon's answer is of another type";
              }
            }
          } catch (const std::exception&) {
            // Still calls the callback, but without the text or without the answer.
            result = {answer ? ReportingStatus::OutOfResources : status, {}, {}};
          }
          callback(std::move(result));
        };
  }

  bool isSessionThread() const noexcept { return std::this_thread::get_id() == _thread.get_id(); }

  const ForkGuard _process;
  const std::chrono::milliseconds _drainTime;
  const std::shared_ptr<SessionWorker> _worker;
  std::thread _thread;
};

}  // namespace vesk
