// Sends messages from standard input, one per line.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>

#include "platform/result/Result.h"
#include "tools/veskreport/DaemonSession.h"
#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Lines.h"
#include "tools/veskreport/Output.h"
#include "tools/veskreport/Progress.h"

namespace vesk {

/// Sends many messages concurrently and reports each outcome. Reports and skips invalid lines.
class MessageStream {
 public:
  /// `session` must be started and outlive this object.
  MessageStream(DaemonSession& session, const MessageArguments& arguments, std::chrono::milliseconds timeout,
                const Output& output);

  /// Runs until the end of standard input. Returns the exit status.
  int run();

 private:
  Result<Dictionary> parametersOf(const std::string& line) const;
  void send(std::uint64_t line, Dictionary parameters);
  void ended(std::uint64_t line, const ReportingResult<MessageAnswer>& result);
  void failed(std::uint64_t line, const std::string& cause);
  void waitUntilAtMost(std::size_t messages);
  int finish();

  DaemonSession& _session;
  const MessageArguments& _arguments;
  const std::chrono::milliseconds _timeout;
  const Output& _output;
  LineReader _lines;
  Progress _progress;

  // Shared with the session's thread.
  std::mutex _mutex;
  std::condition_variable _hasEnded;
  std::size_t _underway = 0;
  std::uint64_t _sent = 0;
  std::uint64_t _failed = 0;
};

}  // namespace vesk
