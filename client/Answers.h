// From the bus's answers to the results that callers get.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <condition_variable>
#include <exception>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "client/ClientCall.h"
#include "platform/ipc/BusClient.h"

namespace vesk {

template <class Answer>
bool readAnswer(BusAnswer& bus, Answer& out) {
  return bus.read(out);
}
inline bool readAnswer(BusAnswer&, std::monostate&) { return true; }

/// The end of a call whose answer `callback` gets. Throws std::bad_alloc.
template <class Answer>
std::shared_ptr<CallEnd> endFor(ReportingCallback<Answer> callback) {
  return std::make_shared<CallEnd>(
      [callback = std::move(callback)](ReportingStatus status, BusAnswer* answer, std::string_view detail) {
        ReportingResult<Answer> result{status, {}, {}};
        try {
          result.detail = detail;
          if (answer && !readAnswer(*answer, result.answer)) {
            result.status = ReportingStatus::Refused;
            result.detail = "the daemon's answer is of another type";
          }
        } catch (const std::exception&) {
          // The callback is called all the same: without the words, or without the answer.
          result = {answer ? ReportingStatus::OutOfResources : status, {}, {}};
        }
        callback(std::move(result));
      });
}

/// An answer that a caller waits for. Shared by both: the caller may have gone when it comes.
template <class Answer>
class PendingAnswer {
 public:
  void set(ReportingResult<Answer>&& result) {
    {
      std::lock_guard lock(_mutex);
      _result = std::move(result);
    }
    _isSet.notify_one();
  }

  /// Returns a tenth of a second after the deadline at the latest, when a callback holds the session's
  /// thread.
  ReportingResult<Answer> wait(ClientCall::Time deadline) {
    // The session's thread knows better why there is no answer in time; it is given a moment to say so.
    constexpr std::chrono::milliseconds kGrace{100};
    std::unique_lock lock(_mutex);
    _isSet.wait_until(lock, deadline + kGrace, [this] { return _result.has_value(); });
    if (!_result) return {ReportingStatus::TimedOut, {}, {}};
    return std::move(*_result);
  }

 private:
  std::mutex _mutex;
  std::condition_variable _isSet;
  std::optional<ReportingResult<Answer>> _result;
};

}  // namespace vesk
