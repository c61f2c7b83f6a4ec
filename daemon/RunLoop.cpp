#include "daemon/RunLoop.h"

#include <poll.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <system_error>
#include <utility>

namespace vesk {

namespace {

constexpr int kMostLooks = 10;

sigset_t stopSignals() {
  sigset_t signals;
  ::sigemptyset(&signals);
  ::sigaddset(&signals, SIGTERM);
  ::sigaddset(&signals, SIGINT);
  ::sigaddset(&signals, SIGHUP);
  return signals;
}

}  // namespace

RunLoop::RunLoop(Options options, BusyMarker& busyMarker, ServiceManager& serviceManager)
    : _options(std::move(options)), _busyMarker(busyMarker), _serviceManager(serviceManager) {
  sigset_t signals = stopSignals();
  _signals = FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!_signals) throw std::system_error(errno, std::generic_category(), "signalfd");
  ::pthread_sigmask(SIG_BLOCK, &signals, &_previousMask);
  ::signal(SIGPIPE, SIG_IGN);
}

RunLoop::~RunLoop() { ::pthread_sigmask(SIG_SETMASK, &_previousMask, nullptr); }

RunLoop::Outcome RunLoop::run() {
  noteBusyMarker(Clock::now());
  pingWatchdog(Clock::now());
  for (;;) {
    pollfd events[] = {
        {_signals.get(), POLLIN, 0}, {_stopRequest.fd(), POLLIN, 0}, {_busyMarker.descriptor(), POLLIN, 0}};
    if (::poll(events, std::size(events), pollTimeout(Clock::now())) < 0) continue;
    if (events[0].revents != 0) {
      signalfd_siginfo signal{};
      [[maybe_unused]] auto taken = ::read(_signals.get(), &signal, sizeof signal);
      ::pthread_sigmask(SIG_SETMASK, &_previousMask, nullptr);
      return signal.ssi_signo == SIGHUP ? Outcome::Reload : Outcome::Signalled;
    }
    if (events[1].revents != 0) return _requested;
    auto now = Clock::now();
    if (events[2].revents != 0) noteBusyMarker(now);
    pingWatchdog(now);
    lookForPause(now);
    if (_idleDeadline && now >= *_idleDeadline && !_busyMarker.isBusy()) return Outcome::Idle;
  }
}

void RunLoop::end(Outcome outcome) noexcept {
  _requested = outcome;
  _stopRequest.signal();
}

void RunLoop::noteBusyMarker(Clock::time_point now) {
  _busyMarker.acknowledge();
  _idleDeadline.reset();
  if (_options.idleExit && !_busyMarker.isBusy()) _idleDeadline = now + *_options.idleExit;
}

void RunLoop::pingWatchdog(Clock::time_point now) {
  auto interval = _serviceManager.watchdogInterval();
  if (!interval || (_nextPing && now < *_nextPing)) return;
  _serviceManager.pingWatchdog();
  _nextPing = now + *interval;
}

void RunLoop::lookForPause(Clock::time_point now) {
  if (!_options.onPause) return;
  if (!_nextLook) {
    _looks = 0;
    if (_busyMarker.isTouched()) _nextLook = now + _options.pause;
    return;
  }
  if (now < *_nextLook) return;
  if (_busyMarker.takeTouch() && ++_looks < kMostLooks) {
    _nextLook = now + _options.pause;
    return;
  }
  _nextLook.reset();
  _options.onPause();
}

int RunLoop::pollTimeout(Clock::time_point now) const {
  auto next = Clock::time_point::max();
  if (_idleDeadline) next = std::min(next, *_idleDeadline);
  if (_nextPing) next = std::min(next, *_nextPing);
  if (_nextLook) next = std::min(next, *_nextLook);
  if (next == Clock::time_point::max()) return -1;
  auto wait = std::chrono::ceil<std::chrono::milliseconds>(next - now).count();
  return static_cast<int>(std::clamp<decltype(wait)>(wait, 0, INT_MAX));
}

}  // namespace vesk
