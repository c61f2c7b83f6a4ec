// One post of events, as the daemon sends it.
#pragma once

#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "tools/collector/HTTPMessage.h"

namespace vesk {

struct EventPost {
  double postTime = 0;  ///< seconds since 1970
  std::string clientId;
  List events;               ///< at least one; each a flat dictionary of text, numbers and booleans
  std::size_t jsonSize = 0;  ///< bytes of the decompressed body
};

/// The post, or what is wrong with the request.
struct EventPostOutcome {
  std::optional<EventPost> post;
  std::string problem;
};

/// Checks all of the protocol's requirements: headers, encoding and the shape of the JSON body.
EventPostOutcome readEventPost(const HTTPReceived& received);

}  // namespace vesk
