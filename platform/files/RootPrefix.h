// The root prefix: paths in this project are written as on a device and resolved here.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// The directory that replaces "/", without a trailing slash; empty for the real root. Set by
/// `setRootPrefix`, otherwise by the environment variable VESKREPORTINGD_ROOT. A program with more privileges
/// than its caller (setuid, setgid, file capabilities) ignores the variable. Thread-safe after start-up.
const std::string& rootPrefix();

/// Call at most once, at the beginning of `main`, before any thread starts.
void setRootPrefix(std::string_view prefix);

/// Returns `path`, which must be absolute, below the root prefix.
std::string pathUnderRoot(std::string_view path);

/// Whether `name` plus an extension is safe as a file name within a directory: not empty, no "/" or NUL, no
/// leading ".".
bool isPlainFileName(std::string_view name) noexcept;

}  // namespace vesk
