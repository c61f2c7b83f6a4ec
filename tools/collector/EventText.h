// Events as text: for a person, and as JSON lines.
#pragma once

#include <string>
#include <string_view>

#include "platform/time/Clock.h"
#include "tools/collector/EventPost.h"

namespace vesk {

/// The post on one line, its X-Vesk headers, then each event with its entries; without the last line feed and
/// with no control character but line feeds.
std::string readableText(const EventPost& post, const HTTPReceived& received, WallTime now);

/// One line an event, each with its line feed: a JSON object of "received" (seconds since 1970), "peer",
/// "path", "headers", "postTime", "clientId" and "event".
std::string jsonLines(const EventPost& post, const HTTPReceived& received, WallTime now);

/// "20:31:29.123", local time.
std::string clockText(WallTime time);
double secondsFrom(WallTime time);

}  // namespace vesk
