// Writes lines to the standard error that a process shares with others.
#pragma once

#include <chrono>
#include <string>

namespace vesk {

/// Writes `line` with a line end in one piece, so that lines of several threads and processes don't mix.
/// Waits up to `patience` for a slow reader, then not again until that reader has caught up. A line without
/// room is lost. Raises no SIGPIPE. Without patience, a line is cut to PIPE_BUF (4096 bytes), because the
/// rest might have to wait. The call can still block if another thread or process fills the pipe between the
/// check and the write.
void writeToStandardError(std::string line, std::chrono::milliseconds patience);

}  // namespace vesk
