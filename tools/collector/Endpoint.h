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

/// Answers the requests for one path and those below it. Called from several servers' threads at once; must
/// not block on the network.
class Endpoint {
 public:
  virtual ~Endpoint() = default;
  virtual HTTPAnswer answer(const HTTPReceived& received) = 0;
};

/// Says on the console why a request is refused, counts it, and makes the answer that tells the peer the
/// same.
class Refusals {
 public:
  Refusals(Console& console, CollectorStats& stats) : _console(console), _stats(stats) {}

  HTTPAnswer operator()(const HTTPReceived& received, unsigned status, std::string_view reason) const;
  /// 405 with the methods that the path knows.
  HTTPAnswer wrongMethod(const HTTPReceived& received, std::string_view allowed) const;

 private:
  Console& _console;
  CollectorStats& _stats;
};

/// Which endpoint answers which path: filled before the server starts, constant afterwards.
class EndpointTable {
 public:
  explicit EndpointTable(Refusals refusals) : _refusals(refusals) {}

  /// `path` ("/events") and everything below it; the longest path wins. The endpoint must outlive the table.
  void add(std::string path, Endpoint& endpoint) { _endpoints.emplace_back(std::move(path), &endpoint); }

  HTTPAnswer answer(const HTTPReceived& received) const;

 private:
  Refusals _refusals;
  std::vector<std::pair<std::string, Endpoint*>> _endpoints;
};

}  // namespace vesk
