// Passes a session's operations to its thread, and owns that thread.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <chrono>
#include <functional>
#include <memory>
#include <semaphore>
#include <thread>
#include <utility>

#include "client/BoundedWait.h"
#include "client/CallBuilding.h"
#include "client/ClientCall.h"
#include "client/ForkGuard.h"
#include "client/ReportingAnswer.h"
#include "client/SessionWorker.h"

namespace vesk {

/// The three ways to post a call. `make` creates it on the caller's thread; an exception there becomes
/// OutOfResources. Thread-safe in the process that created the session; refused in any other process.
class ClientSession {
 public:
  using Timeout = std::chrono::milliseconds;
  /// May take what the answer contains.
  using Callback = std::function<void(ReportingAnswer& answer)>;

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

  /// Posts a one-way call. If a recorder takes the daemon's place, waits until it has recorded the call.
  template <class Make>
  ReportingStatus post(const Make& make) noexcept {
    if (!_isRecorded || isSessionThread()) return push(make);
    const auto status = wait(make, AnswerKind::Nothing, kRecordingTime).status;
    return status == ReportingStatus::Done ? ReportingStatus::Queued : status;
  }

  /// Posts a call whose answer goes to `callback`, which is called once if this returns Queued.
  template <class Make>
  ReportingStatus ask(const Make& make, AnswerKind kind, Callback callback, Timeout timeout) noexcept {
    return push([&] {
      ClientCall call = make();
      call.deadline = deadlineAfter(timeout);
      call.end = endFor(kind, std::move(callback));
      return call;
    });
  }

  /// Waits for the answer, up to a tenth of a second longer while a callback occupies the session's thread.
  template <class Make>
  ReportingAnswer wait(const Make& make, AnswerKind kind, Timeout timeout) noexcept {
    // The session's thread knows best why there is no answer in time; this gives it a moment to report that.
    constexpr std::chrono::milliseconds kGrace{100};
    if (!isOurs()) return {ReportingStatus::ForkedProcess};
    if (isSessionThread()) return {ReportingStatus::OnSessionThread};
    try {
      const auto deadline = deadlineAfter(timeout) + kGrace;
      // Shared with the handler: the caller may be gone when the answer arrives.
      struct Waited {
        ReportingAnswer answer;
        std::binary_semaphore isThere{0};
      };
      auto waited = std::make_shared<Waited>();
      const auto keep = [waited](ReportingAnswer& answer) {
        waited->answer = std::move(answer);
        waited->isThere.release();
      };
      const auto status = ask(make, kind, keep, timeout);
      if (status != ReportingStatus::Queued) return {status};
      if (!waited->isThere.try_acquire_until(deadline)) return {ReportingStatus::TimedOut};
      return std::move(waited->answer);
    } catch (...) {
      return {ReportingStatus::OutOfResources};
    }
  }

 private:
  static constexpr std::chrono::seconds kRecordingTime{10};

  ClientSession(const ReportingOptions& options, const std::string& recorderSocket);

  template <class Make>
  ReportingStatus push(const Make& make) noexcept {
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

  static ClientCall::Time deadlineAfter(Timeout timeout) noexcept {
    return std::chrono::steady_clock::now() + boundedWait(timeout);
  }

  /// Converts the bus's answer to the one that `callback` gets.
  static CallEnd endFor(AnswerKind kind, Callback callback);

  bool isSessionThread() const noexcept { return std::this_thread::get_id() == _thread.get_id(); }

  const ForkGuard _process;
  const bool _isRecorded;
  const std::chrono::milliseconds _drainTime;
  const std::shared_ptr<SessionWorker> _worker;
  std::thread _thread;
};

}  // namespace vesk
