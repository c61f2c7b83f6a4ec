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
#include "tools/collector/CertificateAuthority.h"
#include "tools/collector/DashboardReceiver.h"
#include "tools/collector/EventsEndpoint.h"
#include "tools/collector/FileEndpoints.h"
#include "tools/collector/StorebagEndpoint.h"

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
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  /// The addresses it listens on and the paths of its files: the entries of the ready file.
  Dictionary facts() const;
  /// The same as readable lines, with instructions for setting up the daemon.
  std::string introduction() const;
  /// A line on what it has taken so far.
  std::string summary() const;

 private:
  std::unique_ptr<HTTPServer> serve(EndpointTable& paths, std::uint16_t port,
                                    std::optional<TLSIdentity> identity);

  const CollectorOptions _options;
  CollectorStats _stats;
  FaultPlan _faults;
  const CollectorServices _services;
  const CertificateAuthority _authority;
  const SigningKey _key;
  EventsEndpoint _events;
  UploadsEndpoint _uploads;
  StorebagEndpoint _storebags;
  LogDataEndpoint _logData;
  ControlEndpoint _control;
  EndpointTable _securePaths;
  EndpointTable _plainPaths;

  // Last, since their threads use all of the above.
  std::unique_ptr<HTTPServer> _secure;
  std::unique_ptr<HTTPServer> _plain;
  std::unique_ptr<DashboardReceiver> _datagrams;
};

}  // namespace vesk
