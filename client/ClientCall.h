// One call on its way from a caller to the daemon.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <list>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/files/GuardedDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

class BusAnswer;

/// State that a call leaves in the daemon and that must be restored after a reconnection.
enum class CallEffect : std::uint8_t { None, Configures, Starts, ChangesUserInfo };

/// Called once, on the session's thread, when a call that wants an answer ends. `answer` is null unless
/// `status` is Done.
using CallEnd = std::function<void(ReportingStatus status, BusAnswer* answer, std::string_view detail)>;

struct ClientCall {
  using Time = std::chrono::steady_clock::time_point;

  IPCEncodedCall call;
  GuardedDescriptor descriptor;                           ///< the descriptor that the arguments borrow
  CallEnd end;                                            ///< empty for a one-way call
  Time deadline{};                                        ///< for the answer
  std::size_t memory = 0;                                 ///< bytes counted against the queue's limit
  std::shared_ptr<const AggregationHandler> aggregation;  ///< takes effect when this call is sent
  CallEffect effect = CallEffect::None;
  std::vector<IPCArgument> arguments;  ///< only for a call with an effect

  /// A connection request calls nothing: its end runs when the daemon is reached.
  bool isConnectionRequest() const noexcept { return call.message.empty(); }
};

/// A list, so that a call keeps its address while it moves between lists.
using ClientCalls = std::list<ClientCall>;

}  // namespace vesk
