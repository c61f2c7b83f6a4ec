// The real daemon and the real collector, as processes under a root of their own.
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

/// A collector and a daemon that trusts it, with a release-environment storebag for client type 5 ("zelko").
class DaemonHarness {
 public:
  /// The daemon is started by `startDaemon`, so that a test can lay out the root first.
  /// `collectorArguments` are added to those of the first start.
  explicit DaemonHarness(std::vector<std::string> collectorArguments = {});

  /// Again on the same ports, after `stopCollector`.
  void startCollector(std::vector<std::string> arguments = {});
  /// In order: an event that it has saved is saved whole.
  void stopCollector();
  /// Waits until clients are accepted.
  void startDaemon(std::vector<std::string> arguments = {});
  /// The same without waiting.
  void launchDaemon(std::vector<std::string> arguments = {});
  /// Ends it by SIGTERM and gives its exit status.
  int stopDaemon();
  ChildProcess& daemon() const { return *_daemon; }
  ChildProcess& collector() { return *_collector; }

  /// Writes a storebag source; the text may say @EVENTS@, @LOGDATA@ and @UDPPORT@ for the collector's
  /// HTTPS URLs of events and log data and its port for datagrams.
  void writeStorebag(const std::string& name, std::string source);
  /// A line of the daemon's preferences or of the device's facts; `value` as TOML writes it, "" for no line.
  void setPreference(const std::string& key, const std::string& value) { _preferences[key] = value; }
  void setDeviceFact(const std::string& key, const std::string& value) { _deviceFacts[key] = value; }

  std::string socketPath() const;
  ReportingOptions clientOptions() const;

  /// The lines of the collector's event file, once `enough` says so; throws after ChildProcess::kPatience.
  using Enough = std::function<bool(const std::vector<boost::json::object>&)>;
  std::vector<boost::json::object> waitForEvents(const Enough& enough) {
    return waitForLines("events.jsonl", enough);
  }
  /// The same of the datagrams that it took.
  std::vector<boost::json::object> waitForDatagrams(const Enough& enough) {
    return waitForLines("collector/datagrams.jsonl", enough);
  }
  /// Until that many events of method `method` are there; gives those.
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

/// A session of client type 5, configured and started.
struct RoadClient {
  explicit RoadClient(const DaemonHarness& harness, Dictionary moreSessionInfo = {},
                      std::optional<Dictionary> userInfo = std::nullopt,
                      AggregationHandler aggregationHandler = {},
                      const std::optional<ReportingOptions>& options = std::nullopt);
  VeskReporting reporting;
  BackendNamesAnswer enabled;
};

}  // namespace vesk::test
