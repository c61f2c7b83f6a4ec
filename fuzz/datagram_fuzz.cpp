// Datagrams of dashboards in both directions: what the collector makes of any bytes, what the daemon makes of
// any acknowledgement, and that the collector reads whatever the daemon writes.
#include <cstdint>
#include <cstdlib>

#include "backends/dashboard/DashboardDelivery.h"
#include "backends/dashboard/DashboardText.h"
#include "platform/unicode/UTF8.h"
#include "tests/support/SimulatedQueues.h"
#include "tools/collector/ReceivedDatagram.h"

namespace {

using namespace vesk;

void require(bool condition) {
  if (!condition) std::abort();
}

void decode(std::string_view bytes) {
  const auto outcome = readDashboardDatagram(bytes);
  require(outcome.datagram.has_value() == outcome.problem.empty());
  if (const auto line = writeLocalLog(bytes)) require(line->size() <= 1151 && isValidUTF8(*line));
  if (!outcome.datagram) return;
  std::string again(kDashboardHeaderSize, '\0');
  encodeDashboardHeader(outcome.datagram->header, again.data());
  require(decodeDashboardHeader(again + std::string(bytes.substr(kDashboardHeaderSize))) ==
          outcome.datagram->header);
  require(readableText(*outcome.datagram).find('\n') == std::string::npos);
  require(jsonLine(*outcome.datagram) != "null\n");
}

/// Keys and values are what stands between NULs.
void encode(std::string_view bytes) {
  MutableDictionary payload;
  while (!bytes.empty()) {
    const std::size_t end = std::min(bytes.find('\0'), bytes.size());
    const std::string_view piece = bytes.substr(0, end);
    const std::size_t middle = std::min(piece.find('='), piece.size());
    payload.set(piece.substr(0, middle), piece.substr(middle));
    bytes.remove_prefix(std::min(end + 1, bytes.size()));
  }
  std::string datagram(kDashboardBufferSize, '\xff');
  const std::size_t size =
      writePayloadText(payload.share(), datagram.data() + kDashboardHeaderSize, kDashboardTextArea);
  require(size < kDashboardTextArea && datagram.back() == '\xff');
  datagram.resize(kDashboardHeaderSize + size);
  DashboardHeader header;
  header.length = static_cast<std::uint16_t>(datagram.size());
  encodeDashboardHeader(header, datagram.data());
  require(readDashboardDatagram(datagram).datagram.has_value());
  decode(datagram);
}

/// A delivery with datagrams pending, over real sockets, and its server.
class Exchange {
 public:
  Exchange() : _queue(std::make_shared<test::SimulatedQueue>()) {
    UDPSocket socket;
    require(_server.open() == 0 && _server.bind({0x7F00'0001, 0}) == 0 && socket.open() == 0);
    _delivery = std::make_shared<DashboardDelivery>(
        std::move(socket), _queue, std::make_shared<DashboardLinger>(1), _counters, "dashboard");
    _delivery->useReliableUDP();
    require(_delivery->connect(*_server.localEndpoint()) && _delivery->start(std::chrono::milliseconds(10)));
  }

  void acknowledge(std::string_view bytes) {
    const std::uint16_t eventID = eventIDOfAcknowledgement(bytes).value_or(1);
    _delivery->send(std::make_unique<DashboardDelivery::Buffer>(), kDashboardHeaderSize, eventID);
    _queue->run();
    char buffer[kDashboardBufferSize];
    IPv4Endpoint client;
    while (_server.receive(buffer, &client)) {
    }
    if (bytes.size() <= 60'000) require(_server.sendTo(client, bytes));
    _queue->advance(std::chrono::milliseconds(bytes.size() % 3));
  }

 private:
  Counters _counters;
  UDPSocket _server;
  std::shared_ptr<test::SimulatedQueue> _queue;
  std::shared_ptr<DashboardDelivery> _delivery;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  static Exchange exchange;
  decode(bytes);
  encode(bytes);
  exchange.acknowledge(bytes);
  return 0;
}
