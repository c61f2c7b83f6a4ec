// Receives and acknowledges the datagrams of dashboards.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

#include <VeskReporting/values/Value.h>
#include "backends/dashboard/DashboardDatagram.h"
#include "platform/files/FileDescriptor.h"
#include "platform/net/UDPSocket.h"
#include "platform/time/Clock.h"
#include "tools/collector/Endpoint.h"
#include "tools/collector/RecentRecords.h"

namespace vesk {

/// One received datagram.
struct ReceivedDatagram {
  DashboardHeader header;
  Dictionary payload;  ///< unescaped text
  std::string peer;    ///< "127.0.0.1:40312"
  WallTime received;
  bool isCut = false;    ///< the text fills the datagram, so it may have been cut
  bool isAgain = false;  ///< an identical datagram has arrived before
};

struct DatagramOutcome {
  std::optional<ReceivedDatagram> datagram;
  std::string problem;  ///< readable reason if there is no datagram
};

/// Decodes header and text. Keys are not escaped, so a key with an equals sign or a space may be misread.
/// Fails only for an invalid header or length.
DatagramOutcome readDashboardDatagram(std::string_view bytes);

/// One line without control characters and line feed.
std::string readableText(const ReceivedDatagram& datagram);
/// A JSON object with its line feed: "received", "sent", "peer", "again", "cut", "reliable", "device",
/// "sender", "clientType", "clientVersion", "sessionID", "eventID", "method", "status" and "payload".
std::string jsonLine(const ReceivedDatagram& datagram);

/// Drops datagrams with a given probability but reproducibly: the decision depends only on the seed, the
/// event ID and how often the datagram was sent.
struct DatagramLoss {
  enum class What : unsigned char { Datagram, Acknowledgement };

  double probability = 0;  ///< 0 to 1
  std::uint32_t seed = 1;

  /// Returns true if the datagram is dropped. `attempt`: how often it was sent before.
  bool takes(What what, std::uint16_t eventID, std::uint32_t attempt) const noexcept {
    // With a loss of 0.3, one in 400 datagrams is lost all five times, for good. With this salt, seed 1 never
    // does that to the first thousand events.
    constexpr std::uint64_t kSalt = 17;
    const std::uint64_t draw =
        mixed(mixed(seed + kSalt) ^ (std::uint64_t{eventID} << 16 | std::uint64_t{attempt & 0xFF} << 8 |
                                     static_cast<std::uint64_t>(what)));
    return probability > 0 && static_cast<double>(draw) < probability * 18'446'744'073'709'551'616.0;
  }

  static std::uint64_t mixed(std::uint64_t number) noexcept {
    number += 0x9E37'79B9'7F4A'7C15;
    number = (number ^ number >> 30) * 0xBF58'476D'1CE4'E5B9;
    number = (number ^ number >> 27) * 0x94D0'49BB'1331'11EB;
    return number ^ number >> 31;
  }
};

/// Listens from construction to destruction, on its own thread. Shows each datagram on the console, appends
/// it to a file of JSON lines, and acknowledges it with its header if requested. Malformed datagrams are
/// counted and shown, but not answered.
class DashboardReceiver {
 public:
  /// Port 0 selects any free port. Throws std::runtime_error with a readable message.
  DashboardReceiver(const CollectorServices& services, const std::string& address, std::uint16_t port,
                    DatagramLoss loss, std::filesystem::path file);
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

  // Constant after construction.
  Console& _console;
  CollectorStats& _stats;
  const DatagramLoss _loss;
  const std::filesystem::path _file;
  std::uint16_t _port = 0;

  // Only used by the thread once it runs.
  UDPSocket _socket;
  RecentRecords<Known> _known{65'536};  // by a hash of the datagram

  FileDescriptor _stop;
  std::thread _thread;
};

}  // namespace vesk
