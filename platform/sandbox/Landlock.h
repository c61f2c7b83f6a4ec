// Which files the process may use.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/sandbox/SandboxProfile.h"

namespace vesk {

/// Denies the calling thread, and every thread made later, all files but `paths`; also connections that would
/// trace or inspect a process outside. Descriptors that are open already keep working. Programs can't be run
/// from anywhere. Needs no_new_privs. A kernel without Landlock is an error when `required`; else it costs
/// one level-4 line. Returns what went wrong.
[[nodiscard]] std::optional<std::string> restrictFiles(const std::vector<SandboxPath>& paths, bool required);

}  // namespace vesk
