// The real daemon and the real collector, as processes below a temporary root.
#pragma once

#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingKeys.h>

#include <boost/json.hpp>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/ChildProcess.h"
#include "tests/support/TempDirectory.h"
#include "tests/support/WebRequest.h"

namespace vesk::test {

/// A collector and a daemon that trusts it, with a storebag for client type 5 ("zelko") in the release
/// environment.
class DaemonHarness {
 public:
  /// Starts the collector. Tests start the daemon with `startDaemon`, after preparing the root.
  /// `collectorArguments` are only used for this first start.
  explicit DaemonHarness(std::vector<std::string> collectorArguments = {});

  /// Restarts the collector on the same ports, after `stopCollector`.
  void startCollector(std::vector<std::string> arguments = {});
  /// Stops it in an orderly way, so that every saved event is complete.
  void stopCollector();
  /// Starts the daemon and waits until it accepts clients.
  void startDaemon(std::vector<std::string> arguments = {});
  /// Like `startDaemon`, without waiting.
  void launchDaemon(std::vector<std::string> arguments = {});
  /// Ends the daemon with SIGTERM and returns its exit status.
  int stopDaemon();
  ChildProcess& daemon() const { return *_daemon; }
  ChildProcess& collector() { return *_collector; }

  /// Writes a storebag source. In its text, @EVENTS@ and @LOGDATA@ are replaced by the collector's HTTPS URLs
  /// for events and log data, and @UDPPORT@ by its datagram port.
  void writeStorebag(const std::string& name, std::string source, const char* ending = ".toml");
  /// Sets a line of the daemon's preferences or the device's facts. `value` is TOML; "" removes the line.
  void setPreference(const std::string& key, const std::string& value) { _preferences[key] = value; }
  void setDeviceFact(const std::string& key, const std::string& value) { _deviceFacts[key] = value; }

  std::string socketPath() const;
  ReportingOptions clientOptions() const;

  /// Waits for the collector's event file until `enough` returns true, and returns its lines. Throws after
  /// ChildProcess::kPatience.
  using Enough = std::function<bool(const std::vector<boost::json::object>&)>;
  std::vector<boost::json::object> waitForEvents(const Enough& enough) {
    return waitForLines("events.jsonl", enough);
  }
  /// Like `waitForEvents`, for the datagrams that the collector accepted.
  std::vector<boost::json::object> waitForDatagrams(const Enough& enough) {
    return waitForLines("collector/datagrams.jsonl", enough);
  }
  /// Waits for `count` events with method `method`, and returns them.
  std::vector<boost::json::object> waitForEventsOfMethod(int method, std::size_t count);

  void setFault(const std::string& fault);
  std::int64_t collectorCount(const std::string& counter);
  std::string messageLog() const { return root.readAll("var/mobile/Library/Logs/Dunmore/Retired"); }
  std::string fact(const char* name) const { return std::string(_facts.at(name).as_string()); }

  TempDirectory root;

 private:
  std::vector<boost::json::object> linesOf(const std::string& file) const;
  std::vector<boost::json::object> waitForLines(const std::string& file, const Enough& enough);

  std::unique_ptr<ChildProcess> _collector;
  std::unique_ptr<ChildProcess> _daemon;
  boost::json::object _facts;
  std::map<std::string, std::string> _preferences;
  std::map<std::string, std::string> _deviceFacts;
};

/// A message's parameters.
inline Dictionary message(int category, Dictionary payload = {}, int flag = 0) {
  return Dictionary{{"category", category}, {"type", 2}, {"flag", flag}, {"payload", std::move(payload)}};
}
inline bool queued(ReportingStatus status) { return status == ReportingStatus::Queued; }

/// A configured and started session of client type 5.
struct RoadClient {
  explicit RoadClient(const DaemonHarness& harness, Dictionary moreSessionInfo = {},
                      std::optional<Dictionary> userInfo = std::nullopt,
                      AggregationHandler aggregationHandler = {},
                      const std::optional<ReportingOptions>& options = std::nullopt);
  VeskReporting reporting;
  BackendNamesAnswer enabled;
};

}  // namespace vesk::test
