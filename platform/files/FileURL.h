// File URLs, as clients name the files that they upload.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// `text` with its %XX decoded; nothing when one of them is NUL. What is no %XX stays as it is.
std::optional<std::string> percentDecoded(std::string_view text);

/// The path of a file URL, with %XX decoded. Text without the scheme "file" counts as a path. Empty when the
/// URL names another host, or when a decoded byte would be NUL.
std::string pathFromFileURL(std::string_view url);

}  // namespace vesk
