// Dates in the format of HTTP headers.
#pragma once

#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// "Tue, 24 Nov 2026 20:31:29 GMT".
std::string httpDate(std::time_t time);

/// Parses that format only; nullopt for any other text.
std::optional<std::time_t> timeFromHTTPDate(std::string_view text);

}  // namespace vesk
