// File URLs, as clients name the files that they upload.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// The path of a file URL, with %XX decoded. Text without the scheme "file" counts as a path. Empty when the
/// URL names another host, or when a decoded byte would be NUL.
std::string pathFromFileURL(std::string_view url);

}  // namespace vesk
