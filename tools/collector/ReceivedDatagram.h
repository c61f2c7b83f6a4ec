// Datagrams of dashboards as text: for a person, and as JSON lines.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/dashboard/DashboardDatagram.h"
#include "platform/time/Clock.h"

namespace vesk {

/// One datagram as it arrived.
struct ReceivedDatagram {
  DashboardHeader header;
  Dictionary payload;  ///< texts without their escapes
  std::string peer;    ///< "127.0.0.1:40312"
  WallTime received;
  bool isCut = false;    ///< the text fills the datagram, so that something may be missing
  bool isAgain = false;  ///< to the byte the same has been there before
};

struct DatagramOutcome {
  std::optional<ReceivedDatagram> datagram;
  std::string problem;  ///< why there is none, for a person
};

/// Decodes header and text. Keys travel without escapes, so that one with an equals sign or a space in it can
/// be taken for something else; nothing that arrives makes this fail but a header that is none, and
/// a length that no datagram has.
DatagramOutcome readDashboardDatagram(std::string_view bytes);

/// One line, without line feed and control characters.
std::string readableText(const ReceivedDatagram& datagram);
/// A JSON object of "received", "sent", "peer", "again", "cut", "reliable", "device", "sender", "clientType",
/// "clientVersion", "sessionID", "eventID", "method", "status" and "payload", with its line feed.
std::string jsonLine(const ReceivedDatagram& datagram);

}  // namespace vesk
