// Formats datagrams of dashboards as readable text and as JSON lines.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/dashboard/DashboardDatagram.h"
#include "platform/time/Clock.h"

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

}  // namespace vesk
