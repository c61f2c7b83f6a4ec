// How the operations of a session reach its thread.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <chrono>
#include <memory>
#include <utility>
#include <variant>

#include "client/Answers.h"
#include "client/BoundedWait.h"
#include "client/CallBuilding.h"
#include "client/ClientCall.h"
#include "client/SessionThread.h"

namespace vesk {

/// The three ways of posting a call. `make` makes it, on the caller's thread and inside; whatever throws
/// there becomes OutOfResources. For any thread of the process that made the session, and refused in every
/// other.
class ClientSession {
 public:
  using Timeout = std::chrono::milliseconds;

  /// Throws when there is no memory, no descriptor or no thread for it.
  explicit ClientSession(const ReportingOptions& options) : _thread(options) {}

  bool isOurs() const noexcept { return _thread.isOurs(); }
  SessionWorker& worker() noexcept { return _thread.worker(); }

  /// One way.
  template <class Make>
  ReportingStatus post(const Make& make) noexcept {
    if (!isOurs()) return ReportingStatus::ForkedProcess;
    try {
      return push(make());
    } catch (...) {
      return ReportingStatus::OutOfResources;
    }
  }

  /// With an answer for `callback`; without a callback, one way.
  template <class Answer, class Make>
  ReportingStatus ask(const Make& make, ReportingCallback<Answer> callback, Timeout timeout) noexcept {
    return post([&] {
      ClientCall call = make();
      call.deadline = deadlineAfter(timeout);
      if (callback) call.end = endFor<Answer>(std::move(callback));
      return call;
    });
  }

  /// Waits for the answer.
  template <class Answer, class Make>
  ReportingResult<Answer> wait(const Make& make, Timeout timeout) noexcept {
    return waitFor<Answer>(timeout, [&](ReportingCallback<Answer> callback) {
      return ask<Answer>(make, std::move(callback), timeout);
    });
  }

  ReportingResult<std::monostate> connect(Timeout timeout) noexcept {
    return waitFor<std::monostate>(timeout, [&](ReportingCallback<std::monostate> callback) {
      auto end = endFor<std::monostate>(std::move(callback));
      bool isAsked = worker().requestConnection(std::move(end), deadlineAfter(timeout));
      return isAsked ? ReportingStatus::Queued : ReportingStatus::Closed;
    });
  }

 private:
  static ClientCall::Time deadlineAfter(Timeout timeout) noexcept {
    return std::chrono::steady_clock::now() + boundedWait(timeout);
  }

  ReportingStatus push(ClientCall&& call) {
    // Told here and now: dropped on its way, it would leave the session what it was before, and nobody knew.
    if (call.effect != CallEffect::None && !isEncodable(call)) {
      worker().drops().invalid();
      return ReportingStatus::InvalidArgument;
    }
    ReportingStatus status = worker().queue().push(std::move(call));
    if (status == ReportingStatus::QueueFull && worker().drops().queueFull()) worker().queue().wake();
    return status;
  }

  template <class Answer, class Ask>
  ReportingResult<Answer> waitFor(Timeout timeout, const Ask& ask) noexcept {
    auto outcome = [](ReportingStatus status) { return ReportingResult<Answer>{status, {}, {}}; };
    if (!isOurs()) return outcome(ReportingStatus::ForkedProcess);
    if (_thread.isCurrent()) return outcome(ReportingStatus::OnSessionThread);
    try {
      auto deadline = deadlineAfter(timeout);
      auto pending = std::make_shared<PendingAnswer<Answer>>();
      auto status = ask([pending](ReportingResult<Answer> result) { pending->set(std::move(result)); });
      return status == ReportingStatus::Queued ? pending->wait(deadline) : outcome(status);
    } catch (...) {
      return outcome(ReportingStatus::OutOfResources);
    }
  }

  SessionThread _thread;
};

}  // namespace vesk
