// File URLs, with which clients name the files that they upload.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// Returns the percent-decoded path of a file URL. Text without the scheme "file" is taken as a path. Returns
/// an empty string if the URL names another host or a decoded byte would be NUL.
std::string pathFromFileURL(std::string_view url);

}  // namespace vesk
