// The base of endpoints that give bad answers on request.
#pragma once

#include "tools/collector/Endpoint.h"
#include "tools/collector/FaultPlan.h"

namespace vesk {

/// What the endpoints share. Outlives them.
struct CollectorServices {
  Console& console;
  CollectorStats& stats;
  FaultPlan& faults;
};

/// Applies the planned faults to the answers and reports them on the console.
class FaultyEndpoint : public Endpoint {
 public:
  /// Returns the result of `serve` with the next planned fault applied. Doesn't call `serve` if the fault
  /// replaces the answer.
  HTTPAnswer answer(const HTTPReceived& received) final;

 protected:
  FaultyEndpoint(const CollectorServices& services, FaultTarget target)
      : _console(services.console),
        _stats(services.stats),
        _refuse(services.console, services.stats),
        _faults(services.faults),
        _target(target) {}

  /// Returns the good answer. `fault` is what will be applied to it, or null.
  virtual HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) = 0;

  Console& _console;
  CollectorStats& _stats;
  const Refusals _refuse;

 private:
  FaultPlan& _faults;
  const FaultTarget _target;
};

}  // namespace vesk
