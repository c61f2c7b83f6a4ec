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

/// What a call leaves behind in the daemon, which has to be done again after a reconnection.
enum class CallEffect : std::uint8_t { None, Configures, Starts, ChangesUserInfo };

/// The end of a call that wants an answer; called once, on the session's thread. `answer` is null unless
/// `status` is Done.
using CallEnd = std::function<void(ReportingStatus status, BusAnswer* answer, std::string_view detail)>;

struct ClientCall {
  using Time = std::chrono::steady_clock::time_point;

  IPCEncodedCall call;
  GuardedDescriptor descriptor;                           ///< the one that the arguments borrow
  CallEnd end;                                            ///< empty: the call is one way
  Time deadline{};                                        ///< of the answer
  std::size_t memory = 0;                                 ///< bytes that it counts in the queue
  std::shared_ptr<const AggregationHandler> aggregation;  ///< in force once this call was sent
  CallEffect effect = CallEffect::None;
  std::vector<IPCArgument> arguments;  ///< of a call with an effect

  /// Calls nothing: its end is told when the daemon is reached.
  bool isConnectionRequest() const noexcept { return call.message.empty(); }
};

/// A call keeps its place in memory while it moves from list to list.
using ClientCalls = std::list<ClientCall>;

}  // namespace vesk
