// The Retry-After header of an answer.
#pragma once

#include <chrono>
#include <optional>

#include "platform/http/HTTPClient.h"
#include "platform/time/Clock.h"

namespace vesk {

/// The wait that the server asks for, from `now`; nullopt without a valid header. A date that is over gives
/// 0.
std::optional<std::chrono::seconds> retryAfter(const HTTPResponse& response, WallTime now);

}  // namespace vesk
