// Takes the datagrams of dashboards and acknowledges them.
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

/// Listens from construction to destruction, on a thread of its own. Shows each datagram on the console,
/// appends it to a file of JSON lines, and sends the header of one that asks for it back. What is no datagram
/// is counted and shown, and not answered.
class DashboardReceiver {
 public:
  struct Parts {
    Console& console;
    CollectorStats& stats;
    const WallClock& clock = WallClock::system();
  };
  /// Port 0 takes any free one. Throws std::runtime_error with a message for a person.
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
  /// What is known of a datagram, made when it comes for the first time.
  struct Known {
    std::uint32_t sent = 0;   // so often, lost ones included
    std::uint32_t taken = 0;  // of these
  };
  Known& known(std::string_view bytes);

  // Constant after construction.
  const Parts _parts;
  const DatagramLoss _loss;
  const std::filesystem::path _file;
  std::uint16_t _port = 0;

  // Of the thread only, once it runs.
  UDPSocket _socket;
  std::deque<std::size_t> _recent;  // digests of datagrams, oldest first
  std::unordered_map<std::size_t, Known> _known;

  FileDescriptor _stop;
  std::thread _thread;
};

}  // namespace vesk
