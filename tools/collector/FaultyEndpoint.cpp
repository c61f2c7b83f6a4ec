#include "tools/collector/FaultyEndpoint.h"

namespace vesk {

HTTPAnswer FaultyEndpoint::answer(const HTTPReceived& received) {
  const auto fault = _faults.take(_target);
  if (!fault) return serve(received, nullptr);
  HTTPAnswer answer;
  if (fault->isOnlyInTheAnswer()) {
    answer = serve(received, &*fault);
    // The request was not accepted, so no fault may turn this into a good answer.
    if (answer.fault != HTTPAnswer::Fault::None) return answer;
  }
  ++_stats.faults;
  _console.note("fault on demand for " + received.method + " " + received.target.substr(0, 200) + " from " +
                received.peer);
  fault->applyTo(answer);
  return answer;
}

}  // namespace vesk
