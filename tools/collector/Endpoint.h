// What the collector offers under its paths.
#pragma once

#include <atomic>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/collector/Console.h"
#include "tools/collector/FaultPlan.h"
#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// Each counter is atomic.
struct CollectorStats {
  struct Counter : std::atomic<std::uint64_t> {
    Counter(CollectorStats& stats, const char* counterName) : name(counterName) { stats.all.push_back(this); }
    const char* const name;
  };

  std::vector<const Counter*> all;  ///< in order of declaration; constant after construction

  /// All counters by name.
  Dictionary counters() const {
    MutableDictionary values;
    for (const auto* counter : all) values.append(counter->name, counter->load());
    return values.share();
  }

  Counter posts{*this, "posts"};                            ///< accepted
  Counter events{*this, "events"};                          ///< in accepted posts, without repeated ones
  Counter eventsRepeated{*this, "eventsRepeated"};          ///< left out, since they came before
  Counter eventsNotSaved{*this, "eventsNotSaved"};          ///< in posts left unanswered; the file failed
  Counter storebagsSent{*this, "storebagsSent"};            ///< complete, even with a requested bad signature
  Counter storebagsUnchanged{*this, "storebagsUnchanged"};  ///< answered with 304
  Counter datagrams{*this, "datagrams"};                    ///< accepted from dashboards
  Counter datagramsAgain{*this, "datagramsAgain"};          ///< of these, repeated ones
  Counter datagramsMalformed{*this, "datagramsMalformed"};  ///< rejected as malformed
  Counter datagramsLost{*this, "datagramsLost"};            ///< dropped on request
  Counter acknowledgements{*this, "acknowledgements"};      ///< sent
  Counter acknowledgementsLost{*this, "acknowledgementsLost"};  ///< dropped on request
  Counter logData{*this, "logData"};                            ///< uploads of log data
  Counter uploads{*this, "uploads"};                            ///< accepted files
  Counter refused{*this, "refused"};                            ///< requests that violate the protocol
  Counter notHTTP{*this, "notHTTP"};  ///< connections that ended before a complete request
  Counter faults{*this, "faults"};    ///< injected faults
};

/// What the endpoints share. Outlives them.
struct CollectorServices {
  Console& console;
  CollectorStats& stats;
  FaultPlan& faults;
};

/// Thrown to refuse a request. The reason is shown on the console and is the answer's body.
struct Refusal {
  unsigned status = 400;
  std::string reason;
  std::string allowedMethods{};
};

/// Answers the requests for one path and the paths below it. Called concurrently on several servers' threads.
/// Must not block on the network.
class Endpoint {
 public:
  virtual ~Endpoint() = default;
  /// Returns the result of `serve` with the next planned fault of the target applied. Doesn't call `serve` if
  /// the fault replaces the answer.
  HTTPAnswer answer(const HTTPReceived& received);

 protected:
  /// `faultTarget`: as for FaultPlan; empty if the endpoint has no faults.
  explicit Endpoint(const CollectorServices& services, std::string_view faultTarget = {})
      : _console(services.console), _stats(services.stats), _faults(services.faults), _target(faultTarget) {}

  /// Returns the good answer. `fault` is what will be applied to it, or null. Throws `Refusal`; any other
  /// exception refuses the request with 500.
  virtual HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) = 0;

  Console& _console;
  CollectorStats& _stats;
  FaultPlan& _faults;

 private:
  HTTPAnswer serveOrRefuse(const HTTPReceived& received, const CollectorFault* fault);
  HTTPAnswer refuse(const HTTPReceived& received, const Refusal& refusal);

  const std::string_view _target;
};

/// Throws a `Refusal` unless the request has that method.
void requireMethod(const HTTPReceived& received, std::string_view method);

/// "GET /path from 127.0.0.1:40312".
std::string describeRequest(const HTTPReceived& received);

/// Passes requests on to the endpoints of their paths. Filled before the server starts, constant afterwards.
class EndpointTable : public Endpoint {
 public:
  explicit EndpointTable(const CollectorServices& services) : Endpoint(services) {}
  /// Adds `path` ("/events") and everything below it; not below one added before. The endpoint must outlive
  /// the table.
  void add(std::string path, Endpoint& endpoint) { _endpoints.emplace_back(std::move(path), &endpoint); }

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  std::vector<std::pair<std::string, Endpoint*>> _endpoints;
};

/// Serves two paths below its own. "fault": POST adds faults, one per line, in the form that FaultPlan::add
/// accepts; GET lists the pending ones; DELETE removes them. "stats": GET returns the counters as JSON.
class ControlEndpoint : public Endpoint {
 public:
  explicit ControlEndpoint(const CollectorServices& services) : Endpoint(services) {}

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  void changeFaults(const HTTPReceived& received);
};

}  // namespace vesk
