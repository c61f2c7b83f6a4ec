// What the endpoints that answer badly on demand have in common.
#pragma once

#include "tools/collector/Endpoint.h"
#include "tools/collector/FaultPlan.h"

namespace vesk {

/// What the endpoints share; it outlives them.
struct CollectorServices {
  Console& console;
  CollectorStats& stats;
  FaultPlan& faults;
};

/// Makes answers bad where a fault on demand says so, and tells it on the console.
class FaultyEndpoint : public Endpoint {
 public:
  /// What `serve` gives, with the fault that is due, if any. `serve` is not called when the fault comes
  /// instead of the answer.
  HTTPAnswer answer(const HTTPReceived& received) final;

 protected:
  FaultyEndpoint(const CollectorServices& services, FaultTarget target)
      : _console(services.console),
        _stats(services.stats),
        _refuse(services.console, services.stats),
        _faults(services.faults),
        _target(target) {}

  /// The good answer. `fault` is what becomes of it afterwards, or null.
  virtual HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) = 0;

  Console& _console;
  CollectorStats& _stats;
  const Refusals _refuse;

 private:
  FaultPlan& _faults;
  const FaultTarget _target;
};

}  // namespace vesk
