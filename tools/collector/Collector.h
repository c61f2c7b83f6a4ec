// The development collector: its keys, its endpoints and its two HTTP servers.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/collector/Console.h"
#include "tools/collector/DashboardReceiver.h"
#include "tools/storebag/StorebagSource.h"

namespace vesk {

struct CollectorOptions {
  std::filesystem::path directory;  ///< the collector's own files
  std::string address = "127.0.0.1";
  std::uint16_t httpsPort = 8443;  ///< 0: any free port
  std::uint16_t httpPort = 8080;   ///< 0: any free port
  std::uint16_t udpPort = 9053;    ///< 0: any free port
  DatagramLoss datagramLoss{};
  std::filesystem::path storebags;                       ///< empty: "storebags" in `directory`
  std::filesystem::path events;                          ///< empty: "events.jsonl" in `directory`
  std::filesystem::path uploads{};                       ///< empty: "uploads" in `directory`
  std::string uploadAnswer = R"({"result":"success"})";  ///< to every accepted file
  std::optional<std::chrono::seconds> maximumAge{};
  std::vector<std::string> names{};   ///< further names and addresses for the certificate
  std::vector<std::string> faults{};  ///< as for FaultPlan::add
  StorebagChecks checks = StorebagChecks::Strict;
};

/// Runs from construction to destruction. Serves all paths over HTTPS and HTTP, except the control path,
/// which is served over HTTP only. Receives datagrams on a UDP port.
class Collector {
 public:
  /// Creates missing directories, the certificate authority and the signing key. Throws std::runtime_error
  /// with a readable message.
  Collector(CollectorOptions options, Console& console);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  /// The addresses it listens on and the paths of its files: the entries of the ready file.
  Dictionary facts() const;
  /// The same as readable lines, with instructions for setting up the daemon.
  std::string introduction() const;

 private:
  struct Parts;
  std::unique_ptr<Parts> _parts;
};

}  // namespace vesk
