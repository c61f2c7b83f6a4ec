// Receives and acknowledges the datagrams of dashboards.
#pragma once

#include <cstdint>
#include <deque>
#include <filesystem>
#include <string_view>
#include <thread>
#include <unordered_map>

#include "platform/files/FileDescriptor.h"
#include "platform/net/UDPSocket.h"
#include "platform/time/Clock.h"
#include "tools/collector/CollectorStats.h"
#include "tools/collector/Console.h"
#include "tools/collector/DatagramLoss.h"
#include "tools/collector/ReceivedDatagram.h"

namespace vesk {

/// Listens from construction to destruction, on its own thread. Shows each datagram on the console, appends
/// it to a file of JSON lines, and acknowledges it with its header if requested. Malformed datagrams are
/// counted and shown, but not answered.
class DashboardReceiver {
 public:
  struct Parts {
    Console& console;
    CollectorStats& stats;
    const WallClock& clock = WallClock::system();
  };
  /// Port 0 selects any free port. Throws std::runtime_error with a readable message.
  DashboardReceiver(Parts parts, const std::string& address, std::uint16_t port, DatagramLoss loss,
                    std::filesystem::path file);
  ~DashboardReceiver();
  DashboardReceiver(const DashboardReceiver&) = delete;
  DashboardReceiver& operator=(const DashboardReceiver&) = delete;

  std::uint16_t port() const { return _port; }

 private:
  void serve();
  void take(std::string_view bytes, const IPv4Endpoint& peer);
  void record(const ReceivedDatagram& datagram);
  void acknowledge(std::string_view bytes, std::uint16_t eventID, std::uint32_t attempt,
                   const IPv4Endpoint& peer);
  /// The history of one datagram, created when it first arrives.
  struct Known {
    std::uint32_t sent = 0;   // how often it was sent, including lost ones
    std::uint32_t taken = 0;  // how often it was accepted
  };
  Known& known(std::string_view bytes);

  // Constant after construction.
  const Parts _parts;
  const DatagramLoss _loss;
  const std::filesystem::path _file;
  std::uint16_t _port = 0;

  // Only used by the thread once it runs.
  UDPSocket _socket;
  std::deque<std::size_t> _recent;  // digests of recent datagrams, oldest first
  std::unordered_map<std::size_t, Known> _known;

  FileDescriptor _stop;
  std::thread _thread;
};

}  // namespace vesk
