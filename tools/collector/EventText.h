// Formats events as readable text and as JSON lines.
#pragma once

#include <string>
#include <string_view>

#include "platform/time/Clock.h"
#include "tools/collector/EventPost.h"

namespace vesk {

/// One line for the post, then its X-Vesk headers, then each event with its entries. No final line feed, and
/// no other control characters than line feeds.
std::string readableText(const EventPost& post, const HTTPReceived& received, WallTime now);

/// One line per event, with its line feed: a JSON object with "received" (seconds since 1970), "peer",
/// "path", "headers", "postTime", "clientId" and "event".
std::string jsonLines(const EventPost& post, const HTTPReceived& received, WallTime now);

/// "20:31:29.123", local time.
std::string clockText(WallTime time);
double secondsFrom(WallTime time);

}  // namespace vesk
