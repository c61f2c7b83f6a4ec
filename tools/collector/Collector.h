// The development collector: its keys, its endpoints and the two servers in front of them.
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
  std::uint16_t httpsPort = 8443;  ///< 0: any free one
  std::uint16_t httpPort = 8080;   ///< 0: any free one
  std::uint16_t udpPort = 9053;    ///< 0: any free one
  DatagramLoss datagramLoss{};
  std::filesystem::path storebags;                       ///< empty: "storebags" in `directory`
  std::filesystem::path events;                          ///< empty: "events.jsonl" in `directory`
  std::filesystem::path uploads{};                       ///< empty: "uploads" in `directory`
  std::string uploadAnswer = R"({"result":"success"})";  ///< to every file that is taken
  std::optional<std::chrono::seconds> maximumAge{};
  std::vector<std::string> names{};   ///< further names and addresses for the certificate
  std::vector<std::string> faults{};  ///< as for FaultPlan::add
  StorebagChecks checks = StorebagChecks::Strict;
};

/// Runs from construction to destruction. Everything is offered over HTTPS and over HTTP; the control path
/// over HTTP only. Datagrams are taken on a port of their own.
class Collector {
 public:
  /// Makes directories, the certificate authority and the signing key where they are missing. Throws
  /// std::runtime_error with a message for a person.
  Collector(CollectorOptions options, Console& console);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  /// What it listens on and where its files are: the ready file's entries.
  Dictionary facts() const;
  /// The same for a person, with what to put where; lines.
  std::string introduction() const;

 private:
  struct Parts;
  std::unique_ptr<Parts> _parts;
};

}  // namespace vesk
