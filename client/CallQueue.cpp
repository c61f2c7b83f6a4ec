#include "client/CallQueue.h"

#include <sys/socket.h>

#include <utility>

namespace vesk {

CallQueue::CallQueue(std::size_t maximumCalls, std::size_t maximumMemory) noexcept
    : _maximumCalls(maximumCalls), _maximumMemory(maximumMemory) {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) return;
  _readEnd = GuardedDescriptor(FileDescriptor(ends[0]));
  _writeEnd = GuardedDescriptor(FileDescriptor(ends[1]));
}

ReportingStatus CallQueue::push(ClientCall&& call) {
  bool mustWake = false;
  {
    MutexLock lock(_mutex);
    if (_isClosed) return ReportingStatus::Closed;
    // One call of any size gets into an empty queue; the wire's own limit decides about it.
    bool isFull = _calls >= _maximumCalls || (_calls > 0 && _memory + call.memory > _maximumMemory);
    if (isFull) return ReportingStatus::QueueFull;
    bool isAnswered = call.wantsAnswer();
    std::size_t memory = call.memory;
    _queued.push_back(std::move(call));
    ++_calls;
    _memory += memory;
    _hasAnsweredCall |= isAnswered;
    mustWake = _wakeFor == WakeFor::EveryCall || (isAnswered && _wakeFor == WakeFor::AnsweredCalls);
    if (mustWake) _wakeFor = WakeFor::NothingQueued;
  }
  if (mustWake) wake();
  return ReportingStatus::Queued;
}

void CallQueue::wake() noexcept {
  // A full socket has woken the thread already. send() writes into no file of the host's.
  if (_writeEnd.isOurs()) ::send(_writeEnd.get(), "", 1, MSG_DONTWAIT | MSG_NOSIGNAL);
}

void CallQueue::close() noexcept {
  {
    MutexLock lock(_mutex);
    _isClosed = true;
  }
  wake();
}

void CallQueue::takeAll(std::vector<ClientCall>& calls) noexcept {
  MutexLock lock(_mutex);
  _queued.swap(calls);
  _hasAnsweredCall = false;
}

void CallQueue::leave(std::size_t calls, std::size_t memory) noexcept {
  MutexLock lock(_mutex);
  _calls -= calls;
  _memory -= memory;
}

bool CallQueue::prepareToSleep(WakeFor what) noexcept {
  MutexLock lock(_mutex);
  if (what == WakeFor::EveryCall && !_queued.empty()) return false;
  if (what == WakeFor::AnsweredCalls && _hasAnsweredCall) return false;
  _wakeFor = what;
  return true;
}

void CallQueue::awake(bool descriptorIsReadable) noexcept {
  {
    MutexLock lock(_mutex);
    _wakeFor = WakeFor::NothingQueued;
  }
  char ignored[64];
  while (descriptorIsReadable && _readEnd.isOurs() &&
         ::recv(_readEnd.get(), ignored, sizeof ignored, MSG_DONTWAIT) == sizeof ignored) {
  }
}

}  // namespace vesk
