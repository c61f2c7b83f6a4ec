// What one post carries: headers and JSON.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "backends/BackendIdentity.h"
#include "backends/https/EventBatch.h"
#include "platform/http/HTTPClient.h"
#include "platform/time/Clock.h"

namespace vesk {

struct PostBody {
  std::string json;                             ///< compact, for the server
  std::optional<std::string> prettyJsonString;  ///< for the local message log, when that may have it
};

/// Removes from the events what JSON can't carry, with a line of level 4 each, and serialises them. Nothing
/// when that fails.
std::optional<PostBody> createMessageForPostAndLogging(EventBatch& events, const std::string& clientID,
                                                       WallTime postTime, bool isPrintable);

using PostHeaders = std::vector<std::pair<std::string, std::string>>;

/// All but those of the body. `method` and `responseCode`: of a post that has a single event.
PostHeaders postHeaders(const BackendIdentity& identity, const std::optional<Dictionary>& userInfo,
                        std::optional<std::uint16_t> method, std::optional<std::uint16_t> responseCode);

/// The body goes compressed where that is shorter. `user` is charged for what waits to be posted.
HTTPRequest postRequest(std::string url, PostHeaders headers, std::string json, uid_t user);

}  // namespace vesk
