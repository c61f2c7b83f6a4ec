#include "tools/veskreport/AggregateCommand.h"

#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>

#include <atomic>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <system_error>

#include "platform/files/FileDescriptor.h"
#include "platform/json/JSONWriter.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/DaemonSession.h"

namespace vesk {

namespace {

// "2026-11-24T23:58:25.042Z", or seconds for a time outside the calendar's range.
std::string timeText(double seconds) {
  constexpr double kYear10000 = 253'402'300'800;
  char text[64];
  if (!(seconds >= 0 && seconds < kYear10000)) {
    std::snprintf(text, sizeof text, "%g", seconds);
    return text;
  }
  auto milliseconds = static_cast<long long>(std::floor(seconds * 1000));
  std::time_t whole = milliseconds / 1000;
  std::tm parts{};
  ::gmtime_r(&whole, &parts);
  std::size_t length = std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%S", &parts);
  std::snprintf(text + length, sizeof text - length, ".%03dZ", static_cast<int>(milliseconds % 1000));
  return text;
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

/// Prints on the session's thread and tells the main thread when it may stop waiting.
class Receiver {
 public:
  Receiver(const Output& output, std::uint64_t enough)
      : _output(output), _enough(enough), _end(::eventfd(0, EFD_CLOEXEC)) {
    if (!_end) throw std::system_error(errno, std::generic_category(), "eventfd");
  }

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
    sigset_t interrupts;
    sigemptyset(&interrupts);
    sigaddset(&interrupts, SIGINT);
    sigaddset(&interrupts, SIGTERM);
    ::pthread_sigmask(SIG_BLOCK, &interrupts, nullptr);
    FileDescriptor signals(::signalfd(-1, &interrupts, SFD_CLOEXEC));
    if (!signals) throw std::system_error(errno, std::generic_category(), "signalfd");
    if (!_output.isJSON()) _output.note("waiting for messages");
    pollfd ends[] = {{signals.get(), POLLIN, 0}, {_end.get(), POLLIN, 0}};
    while (::poll(ends, 2, -1) < 0 && errno == EINTR) {
    }
    _ended = true;
  }

  bool wasClosed() const { return _closed; }
  std::uint64_t received() const { return _received; }

 private:
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
    ::eventfd_write(_end.get(), 1);
  }

  const Output& _output;
  const std::uint64_t _enough;
  const FileDescriptor _end;
  std::atomic<bool> _ended{false};
  std::atomic<bool> _closed{false};
  std::atomic<std::uint64_t> _received{0};
};

}  // namespace

int runAggregate(const Invocation& invocation, const Output& output) {
  Receiver receiver(output, invocation.aggregateCount);
  DaemonSession session(invocation.identity, output);
  if (int status = session.start([&](const AggregatedMessage& message) { receiver.take(message); }))
    return status;
  receiver.waitForTheEnd();
  if (std::ferror(stdout)) return kExitFailed;
  if (receiver.wasClosed() && !output.isJSON()) {
    output.note("the aggregation was closed: the daemon ends, or a session above this one aggregates");
  }
  if (output.isJSON()) {
    return output.done("", {{"received", receiver.received()}, {"closed", receiver.wasClosed()}});
  }
  return kExitDone;
}

}  // namespace vesk
