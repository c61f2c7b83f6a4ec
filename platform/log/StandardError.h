// Lines on the standard error that a process shares with others.
#pragma once

#include <chrono>
#include <string>

namespace vesk {

/// Writes `line` and a line's end in one piece, so that lines of several threads and processes do not mix. It
/// waits at most `patience` for a reader that is behind, and then not again before that reader has caught up;
/// a line without room is lost. Raises no SIGPIPE. Without patience a line is cut to what the smallest room
/// of a pipe is sure to hold (PIPE_BUF, 4096 bytes), because the rest would have to wait. What remains is a
/// writer on another thread or in another process that takes the room between the look at it and the write.
void writeToStandardError(std::string line, std::chrono::milliseconds patience);

}  // namespace vesk
