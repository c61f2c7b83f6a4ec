// A dashboard server that answers only on request.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>

#include "backends/dashboard/DashboardDatagram.h"
#include "platform/net/UDPSocket.h"

namespace vesk::test {

constexpr std::uint32_t kLoopback = 0x7F000001;

class DashboardServer {
 public:
  explicit DashboardServer(std::uint32_t address = kLoopback) {
    EXPECT_TRUE(_socket.open());
    EXPECT_TRUE(_socket.bind({address, 0}));
    _endpoint = _socket.localEndpoint().value();
  }

  IPv4Endpoint endpoint() const { return _endpoint; }

  /// Datagrams that arrived since the last call. On loopback they arrive before `send` returns.
  std::vector<std::string> take() {
    std::vector<std::string> datagrams;
    char buffer[2048];
    while (auto size = _socket.receive(buffer, &_client)) datagrams.emplace_back(buffer, *size);
    return datagrams;
  }
  std::vector<int> takeEventIDs() {
    std::vector<int> ids;
    for (const auto& datagram : take()) ids.push_back(eventIDOfAcknowledgement(datagram).value_or(0xFFFF));
    return ids;
  }
  /// Sends to the last sender.
  void send(std::string_view datagram) { EXPECT_TRUE(_socket.sendTo(_client, datagram)); }
  void acknowledge(std::uint16_t eventID, std::size_t size = kDashboardShortestAcknowledgement) {
    std::string datagram(kDashboardShortestAcknowledgement, '\0');
    datagram[60] = static_cast<char>(eventID >> 8);
    datagram[61] = static_cast<char>(eventID);
    send(datagram.substr(0, size));
  }

 private:
  UDPSocket _socket;
  IPv4Endpoint _endpoint;
  IPv4Endpoint _client;
};

/// The number of descriptors that a process has open.
inline long openDescriptors(const std::string& process = "self") {
  auto files = std::filesystem::directory_iterator("/proc/" + process + "/fd");
  return std::distance(begin(files), end(files));
}

}  // namespace vesk::test
