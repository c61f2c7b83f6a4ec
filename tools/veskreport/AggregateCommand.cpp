#include <signal.h>

#include <atomic>
#include <cmath>
#include <cstdio>

#include "platform/json/JSONWriter.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DaemonSession.h"

namespace vesk {

namespace {

// "2026-11-24T23:58:25.042Z", or seconds for a time outside the calendar's range.
std::string timeText(double seconds) {
  constexpr double kYear10000 = 253'402'300'800;
  if (!(seconds >= 0 && seconds < kYear10000)) {
    char text[32];
    std::snprintf(text, sizeof text, "%g", seconds);
    return text;
  }
  const auto milliseconds = static_cast<long long>(std::floor(seconds * 1000));
  std::string text = isoTime(WallTime(std::chrono::milliseconds(milliseconds)));
  return text.insert(text.size() - 1, fractionText(static_cast<int>(milliseconds % 1000)));
}

// A JSON value, or a description if JSON can't represent it (for example bytes).
Value carried(const std::optional<Dictionary>& dictionary) {
  if (!dictionary) return {};
  if (toJSON(*dictionary, JSONStyle::Compact)) return *dictionary;
  return describe(*dictionary);
}

std::string words(const std::optional<Dictionary>& dictionary) {
  if (!dictionary) return "none";
  return printable(toJSON(*dictionary, JSONStyle::Compact).value_or(describe(*dictionary)));
}

/// Prints on the session's thread and wakes the main thread when it may stop waiting.
class Receiver {
 public:
  Receiver(const Output& output, std::uint64_t enough) : _output(output), _enough(enough) { block(SIGUSR1); }

  void take(const AggregatedMessage& message) {
    if (_ended) return;
    if (message.isClosing()) {
      _closed = true;
      return end();
    }
    print(message);
    ++_received;
    // Signals do not reach the session's thread, so the error state is the only sign of a closed pipe.
    if (_received == _enough || std::ferror(stdout)) end();
  }

  /// Until this is called, an interrupt ends the process.
  void waitForTheEnd() {
    block(SIGINT);
    const sigset_t& awaited = block(SIGTERM);
    if (!_output.isJSON()) _output.note("waiting for messages");
    int signal = 0;
    ::sigwait(&awaited, &signal);
    _ended = true;
  }

  bool wasClosed() const { return _closed; }
  std::uint64_t received() const { return _received; }

 private:
  /// Blocks another signal on this thread. Returns all those blocked so far.
  const sigset_t& block(int signal) {
    ::sigaddset(&_blocked, signal);
    ::pthread_sigmask(SIG_BLOCK, &_blocked, nullptr);
    return _blocked;
  }
  void print(const AggregatedMessage& message) const {
    _output.done(timeText(message.timestamp) + " category " + std::to_string(message.category) + " type " +
                     std::to_string(message.type) + " payload " + words(message.payload) + " session " +
                     words(message.sessionInfo),
                 {{"sessionInfo", carried(message.sessionInfo)},
                  {"time", message.timestamp},
                  {"category", int{message.category}},
                  {"type", int{message.type}},
                  {"payload", carried(message.payload)}});
  }
  void end() {
    _ended = true;
    ::pthread_kill(_main, SIGUSR1);
  }

  const Output& _output;
  const std::uint64_t _enough;
  const pthread_t _main = ::pthread_self();
  sigset_t _blocked{};
  std::atomic<bool> _ended{false};
  std::atomic<bool> _closed{false};
  std::atomic<std::uint64_t> _received{0};
};

}  // namespace

int runAggregate(const Invocation& invocation, const Output& output) {
  Receiver receiver(output, invocation.aggregateCount);
  DaemonSession session(invocation, output);
  session.start([&](const AggregatedMessage& message) { receiver.take(message); });
  receiver.waitForTheEnd();
  if (std::ferror(stdout)) return kExitFailed;
  if (output.isJSON())
    return output.done("", {{"received", receiver.received()}, {"closed", receiver.wasClosed()}});
  if (receiver.wasClosed())
    output.note("the aggregation was closed: the daemon ends, or a session above this one aggregates");
  return kExitDone;
}

}  // namespace vesk
