// Where the daemon's files stand: every path of the project is written as on a device and resolved here.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// The directory that stands for "/" (without a trailing slash; "" is the real root). What `setRootPrefix`
/// set, else the environment variable VESKREPORTINGD_ROOT, else the real root. A program that runs with more
/// rights than its caller (setuid, setgid, file capabilities) ignores the variable. Thread-safe after
/// start-up.
const std::string& rootPrefix();

/// Called once, first thing in `main`, before any thread starts.
void setRootPrefix(std::string_view prefix);

/// `path` (absolute) under the root prefix.
std::string pathUnderRoot(std::string_view path);

/// Whether `name`, with an ending of ours behind it, names a file of the directory that it is put behind: not
/// empty, without "/" and NUL, no leading ".".
bool isPlainFileName(std::string_view name) noexcept;

}  // namespace vesk
