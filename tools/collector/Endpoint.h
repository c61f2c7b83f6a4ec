// What the collector offers under its paths.
#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "tools/collector/CollectorStats.h"
#include "tools/collector/Console.h"
#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// Answers the requests for one path and the paths below it. Called concurrently on several servers' threads.
/// Must not block on the network.
class Endpoint {
 public:
  virtual ~Endpoint() = default;
  virtual HTTPAnswer answer(const HTTPReceived& received) = 0;
};

/// Refuses requests: shows the reason on the console, counts it, and builds an answer with the same reason.
class Refusals {
 public:
  Refusals(Console& console, CollectorStats& stats) : _console(console), _stats(stats) {}

  HTTPAnswer operator()(const HTTPReceived& received, unsigned status, std::string_view reason) const;
  /// Answers 405 with the methods that the path supports.
  HTTPAnswer wrongMethod(const HTTPReceived& received, std::string_view allowed) const;

 private:
  Console& _console;
  CollectorStats& _stats;
};

/// Maps paths to endpoints. Filled before the server starts, constant afterwards.
class EndpointTable {
 public:
  explicit EndpointTable(Refusals refusals) : _refusals(refusals) {}

  /// Adds `path` ("/events") and everything below it. The longest matching path wins. The endpoint must
  /// outlive the table.
  void add(std::string path, Endpoint& endpoint) { _endpoints.emplace_back(std::move(path), &endpoint); }

  HTTPAnswer answer(const HTTPReceived& received) const;

 private:
  Refusals _refusals;
  std::vector<std::pair<std::string, Endpoint*>> _endpoints;
};

}  // namespace vesk
