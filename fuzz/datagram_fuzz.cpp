// Datagrams of dashboards in both directions: the collector reads any bytes, the daemon any acknowledgement,
// and the collector reads whatever the daemon writes.
#include <cstdint>
#include <cstdlib>

#include "backends/dashboard/DashboardDatagram.h"
#include "backends/dashboard/DashboardText.h"
#include "platform/unicode/UTF8.h"
#include "tools/collector/DashboardReceiver.h"

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

/// NULs separate keys and values.
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

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  decode(bytes);
  encode(bytes);
  (void)eventIDOfAcknowledgement(bytes);
  return 0;
}
