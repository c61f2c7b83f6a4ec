#include "client/CallQueue.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

namespace vesk {

CallQueue::CallQueue(const ReportingOptions& options)
    : _maximumCalls(options.maximumQueuedMessages), _maximumMemory(options.maximumQueuedBytes) {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) {
    throw std::system_error(errno, std::generic_category(), "socketpair");
  }
  _readEnd = GuardedDescriptor(FileDescriptor(ends[0]));
  _writeEnd = GuardedDescriptor(FileDescriptor(ends[1]));
}

ReportingStatus CallQueue::push(ClientCall&& call) {
  auto status = ReportingStatus::Queued;
  bool mustWake = false;
  {
    MutexLock lock(_mutex);
    if (_drainDeadline) return ReportingStatus::Closed;
    const bool isRequest = call.isConnectionRequest();
    // An empty queue accepts one call of any size; the wire's own limit then applies.
    const bool isFull = _calls >= _maximumCalls || (_calls > 0 && _memory + call.memory > _maximumMemory);
    if (isFull && !isRequest) {
      countDrop(Drop::QueueFull);
      status = ReportingStatus::QueueFull;
      mustWake = !std::exchange(_isBurst, true);
      _mustTellOfBurst |= mustWake;
    } else {
      if (_spare.empty()) _spare.emplace_back();
      _calls += isRequest ? 0 : 1;
      _memory += call.memory;
      if (call.end) _firstDeadline = std::min(_firstDeadline, call.deadline);
      mustWake = _wakeFor == WakeFor::EveryCall || (call.end && _wakeFor == WakeFor::AnsweredCalls);
      _spare.front() = std::move(call);
      ClientCalls& line = isRequest ? _requests : _queued;
      line.splice(line.end(), _spare, _spare.begin());
    }
    if (mustWake) _wakeFor = WakeFor::NothingQueued;
  }
  if (mustWake) wake();
  return status;
}

void CallQueue::wake() noexcept {
  // If the socket is full, the thread is already being woken. send(), unlike write(), can't write to a file
  // that the host has opened under the same number.
  if (_writeEnd.isOurs()) ::send(_writeEnd.get(), "", 1, MSG_DONTWAIT | MSG_NOSIGNAL);
}

void CallQueue::close(Time drainDeadline) noexcept {
  {
    MutexLock lock(_mutex);
    _drainDeadline = drainDeadline;
  }
  wake();
}

bool CallQueue::take(ClientCalls& calls, ClientCalls& requests, Time& firstDeadline) noexcept {
  MutexLock lock(_mutex);
  calls.splice(calls.end(), _queued);
  requests.splice(requests.end(), _requests);
  firstDeadline = std::min(firstDeadline, std::exchange(_firstDeadline, Time::max()));
  return std::exchange(_mustTellOfBurst, false);
}

void CallQueue::leave(std::size_t calls, std::size_t memory, bool wereLast, ClientCalls&& emptied) noexcept {
  MutexLock lock(_mutex);
  _calls -= calls;
  _memory -= memory;
  if (wereLast) _isBurst = false;
  _spare.splice(_spare.end(), emptied);
}

std::optional<CallQueue::Time> CallQueue::drainDeadline() const noexcept {
  MutexLock lock(_mutex);
  return _drainDeadline;
}

bool CallQueue::sleep(WakeFor what, Time::duration wait, pollfd other) noexcept {
  using std::chrono::milliseconds;
  pollfd descriptors[] = {{_readEnd.get(), POLLIN, 0}, other};
  {
    MutexLock lock(_mutex);
    const bool isAnsweredQueued = _firstDeadline != Time::max();
    if (isAnsweredQueued || (what == WakeFor::EveryCall && !_queued.empty())) {
      wait = wait.zero();
    } else {
      _wakeFor = what;
    }
  }
  const auto left =
      std::clamp(std::chrono::ceil<milliseconds>(wait), milliseconds(0), milliseconds(3'600'000));
  const bool isReady = ::poll(descriptors, 2, static_cast<int>(left.count())) > 0;
  {
    MutexLock lock(_mutex);
    _wakeFor = WakeFor::NothingQueued;
  }
  char ignored[64];
  while (isReady && descriptors[0].revents != 0 && _readEnd.isOurs() &&
         ::recv(_readEnd.get(), ignored, sizeof ignored, MSG_DONTWAIT) == sizeof ignored) {
  }
  return isReady && descriptors[1].revents != 0;
}

}  // namespace vesk
