// Lets a test or demonstration control the running collector.
#pragma once

#include "tools/collector/Endpoint.h"
#include "tools/collector/FaultPlan.h"

namespace vesk {

/// Serves two paths below its own. "fault": POST adds faults, one per line, in the form that FaultPlan::add
/// accepts; GET lists the pending ones; DELETE removes them. "stats": GET returns the counters as JSON.
class ControlEndpoint : public Endpoint {
 public:
  ControlEndpoint(Console& console, CollectorStats& stats, FaultPlan& faults)
      : _stats(stats), _faults(faults), _refuse(console, stats) {}

  HTTPAnswer answer(const HTTPReceived& received) override;

 private:
  HTTPAnswer answerFault(const HTTPReceived& received);
  HTTPAnswer plannedFaults() const;
  HTTPAnswer counters() const;

  CollectorStats& _stats;
  FaultPlan& _faults;
  const Refusals _refuse;
};

}  // namespace vesk
