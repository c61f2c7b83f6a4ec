// Lets a test or a demonstration steer the running collector.
#pragma once

#include "tools/collector/Endpoint.h"
#include "tools/collector/FaultPlan.h"

namespace vesk {

/// Below its path: "fault" (POST: one fault a line, as FaultPlan::add takes them; GET: those still to come;
/// DELETE: forgets them) and "stats" (GET: the counters as JSON).
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
