// One call on its way from a caller to the daemon.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

#include "platform/files/GuardedDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

class BusAnswer;

/// What a call leaves behind in the daemon, which has to be done again after a reconnection.
enum class CallEffect : std::uint8_t { None, Configures, Starts, ChangesUserInfo };

/// The end of a call that wants an answer; called once, on the session's thread. `answer` is null unless
/// `status` is Done.
using CallEnd = std::function<void(ReportingStatus status, BusAnswer* answer, std::string_view detail)>;

struct ClientCall {
  using Time = std::chrono::steady_clock::time_point;

  IPCOutgoingCall call{nullptr, nullptr, {}};
  GuardedDescriptor descriptor;                           ///< the one that the arguments borrow
  std::shared_ptr<CallEnd> end;                           ///< null: the call is one way
  Time deadline{};                                        ///< of the answer
  std::size_t memory = 0;                                 ///< bytes that it counts in the queue
  std::shared_ptr<const AggregationHandler> aggregation;  ///< in force once this call was sent
  CallEffect effect = CallEffect::None;

  bool wantsAnswer() const noexcept { return end != nullptr; }
  /// Nothing but arguments, and nobody waits for an answer.
  bool isPlain() const noexcept { return !end && !descriptor; }
};

}  // namespace vesk
