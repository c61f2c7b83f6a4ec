#include "client/SessionWorker.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <poll.h>

#include <algorithm>
#include <exception>
#include <iterator>
#include <utility>

#include "platform/log/SystemLog.h"
#include "protocol/StorebagName.h"

namespace vesk {

namespace {

// Limits consecutive writes, so that answers and aggregated messages are received even under heavy sending.
constexpr int kWritesPerStep = 16;

// One-way calls that are written together: enough to keep system calls cheap, few enough that little has to
// be resent after a loss.
constexpr std::size_t kCallsPerWrite = 64;
constexpr std::size_t kBytesPerWrite = std::size_t{32} << 10;

// Maximum of outstanding answers; further calls that want one wait in the queue.
constexpr std::size_t kMaximumAnswersOwed = 512;

// After sending, the thread checks the queue once more after this time before it asks to be woken. A steady
// stream of messages then costs its senders no system calls.
constexpr std::chrono::milliseconds kNap{1};

// For the answer to a start whose caller doesn't wait: the daemon may be fetching a storebag.
constexpr std::chrono::seconds kStartTime{60};

constexpr std::string_view kDisconnected = "org.freedesktop.DBus.Error.Disconnected";
constexpr char kLost[] = "the daemon has closed the connection";

}  // namespace

void SessionWorker::run() noexcept {
  while (!isFinished(Clock::now()) && _queue.ownsItsDescriptors()) {
    try {
      step();
    } catch (const std::exception& error) {
      // Most likely out of memory. Waiting calls continue to wait, and the next connection introduces the
      // session anew, since the daemon must not get a message before it knows the session.
      VESK_LOG_ERROR("VeskReporting: %s", error.what());
      if (_link.isReady()) connectionBroke(Clock::now());
      ::poll(nullptr, 0, 100);
    } catch (...) {
      VESK_LOG_ERROR("VeskReporting: an unknown exception");
    }
  }
  if (!_queue.ownsItsDescriptors()) {
    VESK_LOG_ERROR("VeskReporting: the session has ended: its process has closed its descriptors");
    _queue.close(Clock::now());
  }
  endEverything();
}

void SessionWorker::step() {
  const Time now = Clock::now();
  const auto urgency = takeCalls();
  endOverdue(now);
  reachDaemon(now, urgency);
  if (startIsDue(now) && !start()) connectionBroke(now);
  sendWaiting(now);
  sayFarewell(now);
  if (!isFinished(now)) sleep(now);
}

bool SessionWorker::isFinished(Time now) const noexcept {
  if (!_drainDeadline) return false;
  if (now >= *_drainDeadline || _farewell == Farewell::Answered) return true;
  return !_link.isReady() && (_waiting.empty() || _isHopeless);
}

void SessionWorker::endEverything() noexcept {
  takeCalls();
  _isConnected.store(false, std::memory_order_relaxed);
  // Before the link ends, which would report a lost connection to them instead.
  for (ClientCall& call : _owed) finish(call, ReportingStatus::Closed);
  _link.lose(Clock::now(), "the session was closed");
  while (!_waiting.empty()) {
    finish(_waiting.front(), ReportingStatus::Closed);
    drop(_waiting.begin(), Drop::Unsent);
  }
  endRequests(ReportingStatus::Closed, "");
}

// --- Incoming calls, and calls that end without an answer

DaemonLink::Urgency SessionWorker::takeCalls() noexcept {
  const std::size_t calls = _waiting.size();
  const std::size_t requests = _requests.size();
  // Read before taking calls: once it is set, no more calls can enter the queue.
  const bool wasClosing = _drainDeadline.has_value();
  _drainDeadline = _queue.drainDeadline();
  // Logged here rather than where the call was refused, because the host's log sink may be slow.
  if (_queue.take(_waiting, _requests, _firstDeadline)) {
    VESK_LOG_WARNING("VeskReporting: too much waits for the daemon, messages are dropped");
  }
  _isNapping = _waiting.size() > calls;
  const bool isUrgent = _requests.size() > requests || _drainDeadline.has_value() != wasClosing;
  if (isUrgent) return DaemonLink::Urgency::AtOnce;
  return _isNapping ? DaemonLink::Urgency::Early : DaemonLink::Urgency::WhenDue;
}

// The effect of an overdue call is still wanted in the daemon, so the call stays as one-way and replaces a
// call just before it that has the same effect.
void SessionWorker::endOverdue(Time now) noexcept {
  if (now < _firstDeadline) return;
  _firstDeadline = Time::max();
  const auto isOverdue = [&](const ClientCall& call) {
    if (!call.end || call.deadline <= now) return static_cast<bool>(call.end);
    _firstDeadline = std::min(_firstDeadline, call.deadline);
    return false;
  };
  for (auto next = _requests.begin(); next != _requests.end();) {
    const auto request = next++;
    if (!isOverdue(*request)) continue;
    finish(*request, _link.problemStatus(), nullptr, _link.problem());
    _requests.erase(request);
  }
  const auto status = _link.isReady() ? ReportingStatus::TimedOut : _link.problemStatus();
  const std::string_view detail = _link.isReady() ? std::string_view() : _link.problem();
  const auto first = std::next(_waiting.begin(), static_cast<std::ptrdiff_t>(_callsInBus));
  for (auto next = first; next != _waiting.end();) {
    const auto call = next++;
    if (!isOverdue(*call)) continue;
    finish(*call, status, nullptr, detail);
    if (call->effect == CallEffect::None) {
      drop(call, Drop::Unsent);
    } else if (call != first && !std::prev(call)->end && std::prev(call)->effect == call->effect) {
      leave(std::prev(call));
    }
  }
}

void SessionWorker::endRequests(ReportingStatus status, std::string_view detail) noexcept {
  for (ClientCall& request : _requests) finish(request, status, nullptr, detail);
  _requests.clear();
}

void SessionWorker::finish(ClientCall& call, ReportingStatus status, BusAnswer* answer,
                           std::string_view detail) noexcept {
  if (!call.end) return;
  try {
    std::exchange(call.end, nullptr)(status, answer, detail);
  } catch (...) {
    VESK_LOG_ERROR("VeskReporting: a callback threw an exception");
  }
}

void SessionWorker::drop(Call call, Drop reason) noexcept {
  _queue.countDrop(reason);
  leave(call);
}

void SessionWorker::leave(Call call) noexcept {
  const std::size_t memory = call->memory;
  _waiting.erase(call);
  _queue.leave(1, memory, _waiting.empty());
}

// --- The link

bool SessionWorker::wantsDaemon() const noexcept {
  if (!_waiting.empty() || !_requests.empty()) return true;
  return !_drainDeadline && (_configuration || _isStarted);
}

void SessionWorker::reachDaemon(Time now, DaemonLink::Urgency urgency) {
  if (_link.isReady()) return endRequests(ReportingStatus::Done, "");
  if (wantsDaemon()) linkHasChanged(_link.reach(now, urgency));
}

void SessionWorker::linkHasChanged(DaemonLink::Change change) {
  if (change == DaemonLink::Change::None) return;
  _isConnected.store(_link.isReady(), std::memory_order_relaxed);
  if (change == DaemonLink::Change::Ready) {
    VESK_LOG_DEBUG("VeskReporting: connected");
    endRequests(ReportingStatus::Done, "");
    return introduceAgain();
  }
  VESK_LOG_DEBUG("VeskReporting: %s", _link.problem().c_str());
  _callsInBus = 0;
  _isHopeless = _drainDeadline && !_link.wasEverReady();
  endRequests(_link.problemStatus(), _link.problem());
}

void SessionWorker::connectionBroke(Time now) { linkHasChanged(_link.lose(now, kLost)); }

void SessionWorker::introduceAgain() {
  const bool isTold =
      (!_configuration || tell(wire::kSetSessionInfo, *_configuration)) && (!_isStarted || start());
  if (!isTold) connectionBroke(Clock::now());
}

/// A start of the library's own.
bool SessionWorker::start() {
  _starts.started();
  return _link.bus().send(
             IPCOutgoingCall{wire::kSessionInterface, wire::kStartConfig.name, {}},
             [this](BusAnswer& answer) { startWasAnswered(answer); },
             kStartTime) == BusClient::SendResult::Sent;
}

bool SessionWorker::startIsDue(Time now) const noexcept {
  return _link.isReady() && !_drainDeadline && now >= _starts.due();
}

void SessionWorker::startWasAnswered(const BusAnswer& answer) {
  std::optional<std::vector<std::string>> backends;
  const Time now = Clock::now();
  if (answer.peek(backends) && backends) return _starts.answeredWithConfiguration(now);
  // A lost connection starts the session anyway when it is there again.
  if (answer.errorName() == kDisconnected || !mayGetConfiguration()) return _starts.started();
  _starts.answeredWithNothing(now, std::uniform_real_distribution<double>()(_random));
}

bool SessionWorker::mayGetConfiguration() const noexcept {
  const auto* info = _configuration ? std::get_if<Dictionary>(&_configuration->front()) : nullptr;
  const auto type = info ? integerForKey(*info, kVeskReportingSessionInfoClientType) : std::nullopt;
  return type && storebagNameForClientType(static_cast<std::int32_t>(*type));
}

bool SessionWorker::tell(const wire::Member& member, const std::vector<IPCArgument>& arguments) {
  return _link.bus().send(IPCOutgoingCall{wire::kSessionInterface, member.name, arguments}) ==
         BusClient::SendResult::Sent;
}

// Needs no memory, because a call that was sent can't be taken back.
void SessionWorker::remember(ClientCall& call) noexcept {
  constexpr std::size_t kUserInfoOfConfiguration = 1, kUserInfoOfStates = 0;
  if (call.effect == CallEffect::Configures) _configuration = std::move(call.arguments);
  if (call.effect == CallEffect::Starts) {
    _isStarted = true;
    _starts.started();
  }
  if (call.effect == CallEffect::ChangesUserInfo && _configuration) {
    (*_configuration)[kUserInfoOfConfiguration] = std::move(call.arguments[kUserInfoOfStates]);
  }
}

// --- Sending

bool SessionWorker::canSend() {
  if (!_link.isReady() || _waiting.empty() || _link.bus().queuedMessages() > 0) return false;
  return !_waiting.front().end || _owed.size() < kMaximumAnswersOwed;
}

// One-way calls are kept here until the socket has taken them, since those held only by the bus would be lost
// with the connection. The bus reports such a loss to calls that want an answer.
void SessionWorker::sendWaiting(Time now) {
  callsHaveLeft();
  for (int writes = 0; writes < kWritesPerStep && canSend(); ++writes) {
    if (!sendTogether(now)) return connectionBroke(now);
    callsHaveLeft();
  }
}

/// Sends one call that wants an answer, or the one-way calls up to the next such call. Returns false if the
/// connection has ended.
bool SessionWorker::sendTogether(Time now) {
  BusClient& bus = _link.bus();
  for (auto next = _waiting.begin(); next != _waiting.end();) {
    const auto call = next++;
    if (call->effect == CallEffect::Starts &&
        !call->end) {  // has no callback, but its answer decides about another start
      call->end = [](ReportingStatus, BusAnswer*, std::string_view) {};
      call->deadline = now + kStartTime;
      _firstDeadline = std::min(_firstDeadline, call->deadline);
    }
    const bool isAnswered = static_cast<bool>(call->end);
    if (isAnswered && _callsInBus > 0) break;
    const auto status = handOver(call, now);
    if (status == ReportingStatus::NotConnected) return false;
    if (status != ReportingStatus::Queued) {
      finish(*call, status);
      drop(call, Drop::Unsent);
    }
    if (isAnswered || _callsInBus == kCallsPerWrite || bus.addedBytes() >= kBytesPerWrite) break;
  }
  return bus.write() == BusClient::Progress::Connected;
}

/// Returns Queued if the bus has taken the call, otherwise the reason.
ReportingStatus SessionWorker::handOver(Call call, Time now) {
  if (call->descriptor && !call->descriptor.isOurs()) return ReportingStatus::FileUnavailable;
  BusClient& bus = _link.bus();
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(call->deadline - now);
  const auto onAnswer = [this, call](BusAnswer& answer) { answered(call, answer); };
  const auto result = call->end ? bus.send(call->call, onAnswer, left) : bus.add(call->call);
  if (result == BusClient::SendResult::OutOfResources) return ReportingStatus::OutOfResources;
  if (result != BusClient::SendResult::Sent) return ReportingStatus::NotConnected;
  if (call->effect == CallEffect::Configures) _receiver->setHandler(call->aggregation);
  if (call->end) {
    remember(*call);
    _owed.splice(_owed.end(), _waiting, call);
    _queue.leave(1, call->memory, _waiting.empty());
  } else {
    ++_callsInBus;
  }
  return ReportingStatus::Queued;
}

void SessionWorker::callsHaveLeft() {
  if (_callsInBus == 0) return;
  const std::size_t held = std::min(_callsInBus, _link.bus().queuedMessages());
  ClientCalls left;
  std::size_t memory = 0;
  for (; _callsInBus > held; --_callsInBus) {
    remember(_waiting.front());
    memory += _waiting.front().memory;
    _waiting.front() = ClientCall{};
    left.splice(left.end(), _waiting, _waiting.begin());
  }
  if (!left.empty()) _queue.leave(left.size(), memory, _waiting.empty(), std::move(left));
}

void SessionWorker::answered(Call call, BusAnswer& answer) noexcept {
  ClientCalls one;
  one.splice(one.begin(), _owed, call);
  if (call->effect == CallEffect::Starts) {
    try {
      startWasAnswered(answer);
    } catch (const std::exception&) {
      // No memory for the names of the backends; the session is not started again by itself.
    }
  }
  if (!answer.isError()) return finish(*call, ReportingStatus::Done, &answer);
  if (answer.errorName() == kDisconnected) {
    // A host that closes descriptors ends the session, whichever descriptor is noticed first.
    if (!_queue.ownsItsDescriptors()) return finish(*call, ReportingStatus::Closed);
    return finish(*call, ReportingStatus::NotConnected, nullptr, kLost);
  }
  // The same error name is used for an expired timeout and for a daemon that sent no answer.
  const bool isOverdue =
      answer.errorName() == "org.freedesktop.DBus.Error.NoReply" && Clock::now() >= call->deadline;
  finish(*call, isOverdue ? ReportingStatus::TimedOut : ReportingStatus::Refused, nullptr,
         answer.errorText());
}

// The daemon serves calls in order, so its answer to this one shows that it has taken all earlier calls. If
// the connection were closed sooner, it could break while the daemon is still answering, and unread calls
// would be lost.
void SessionWorker::sayFarewell(Time now) {
  const bool isTime =
      _drainDeadline && _farewell == Farewell::NotYet && _link.isReady() && _waiting.empty() && _owed.empty();
  if (!isTime) return;
  const auto result = _link.bus().send(
      IPCOutgoingCall{"org.freedesktop.DBus.Peer", "Ping", {}},
      [this](BusAnswer&) { _farewell = Farewell::Answered; },
      std::chrono::ceil<std::chrono::milliseconds>(*_drainDeadline - now));
  _farewell = result == BusClient::SendResult::Sent ? Farewell::Asked : Farewell::Answered;
}

// --- Sleeping

void SessionWorker::sleep(Time now) {
  const bool isReady = _queue.sleep(wakeFor(), nextDue(now) - now, _link.polled());
  now = Clock::now();
  if (isReady || _link.nextDue(now) <= now) linkHasChanged(_link.process(now));
}

SessionWorker::Time SessionWorker::nextDue(Time now) {
  if (canSend()) return now;
  Time due = std::min(now + std::chrono::hours(1), _firstDeadline);
  if (!_link.isAway() || wantsDaemon()) due = std::min(due, _link.nextDue(now));
  if (_drainDeadline) due = std::min(due, *_drainDeadline);
  if (_link.isReady() && !_drainDeadline) due = std::min(due, _starts.due());
  if (_isNapping && _waiting.empty()) due = std::min(due, now + kNap);
  return due;
}

CallQueue::WakeFor SessionWorker::wakeFor() const noexcept {
  const bool isBusy =
      _link.isReady() ? !_waiting.empty() || _isNapping : wantsDaemon() && !_link.mayReachEarly();
  return isBusy ? CallQueue::WakeFor::AnsweredCalls : CallQueue::WakeFor::EveryCall;
}

}  // namespace vesk
