// The contents of one post: headers and JSON.
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
  std::optional<std::string> prettyJsonString;  ///< for the local message log, if allowed there
};

/// Serialises the events without what JSON can't carry, which is logged at level 4. Returns nullopt on
/// failure.
std::optional<PostBody> createMessageForPostAndLogging(EventBatch& events, const std::string& clientID,
                                                       WallTime postTime, bool isPrintable);

using PostHeaders = std::vector<std::pair<std::string, std::string>>;

/// All headers except those of the body. `method` and `responseCode` are set for a post with a single event.
PostHeaders postHeaders(const BackendIdentity& identity, const std::optional<Dictionary>& userInfo,
                        std::optional<std::uint16_t> method, std::optional<std::uint16_t> responseCode);

/// Compresses the body if that makes it shorter. Posts waiting to be sent are charged to `user`.
HTTPRequest postRequest(std::string url, PostHeaders headers, std::string json, const BackendClient& client);

}  // namespace vesk
