#include "client/SessionWorker.h"

#include <poll.h>

#include <algorithm>
#include <exception>
#include <new>
#include <utility>

#include "client/AggregationReceiver.h"
#include "client/protocol/WireNames.h"
#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// Writes in a row, so that answers and aggregated messages are received also while much is sent.
constexpr int kWritesPerStep = 16;

// One-way calls that are written together: enough to make the system call cheap, few enough to keep what has
// to be sent again after a loss small.
constexpr std::size_t kCallsPerWrite = 64;
constexpr std::size_t kBytesPerWrite = std::size_t{32} << 10;

// Answers that the daemon may owe us; further calls that want one wait in the queue.
constexpr std::size_t kMaximumAnswersOwed = 512;

// After sending, the thread looks again after this time before it asks to be woken: a steady stream of
// messages then costs its senders no system call.
constexpr std::chrono::milliseconds kNap{1};

std::string socketOf(const ReportingOptions& options) {
  return options.socketPath.empty() ? pathUnderRoot(wire::kSocketPath) : options.socketPath;
}

}  // namespace

SessionWorker::SessionWorker(const ReportingOptions& options)
    : _queue(options.maximumQueuedMessages, options.maximumQueuedBytes),
      _link(socketOf(options), ReconnectPolicy(options.firstReconnectWait, options.lastReconnectWait),
            std::make_shared<AggregationReceiver>(static_cast<ClientSessionReplyInterface&>(*this))) {}

bool SessionWorker::requestConnection(std::shared_ptr<CallEnd> end, ClientCall::Time deadline) {
  {
    MutexLock lock(_mutex);
    if (_hasEnded) return false;
    _newRequests.push_back({std::move(end), deadline});
  }
  _queue.wake();
  return true;
}

void SessionWorker::stop(ClientCall::Time deadline) noexcept {
  // Closed first: once the thread knows that it has to end, nothing can get in behind its last look.
  _queue.close();
  {
    MutexLock lock(_mutex);
    _newDrainDeadline = deadline;
  }
  _queue.wake();
}

void SessionWorker::run() noexcept {
  while (!isFinished(Clock::now()) && _queue.ownsItsDescriptors()) {
    try {
      step();
    } catch (const std::exception& error) {
      // Out of memory, most likely: what waits goes on waiting.
      VESK_LOG_ERROR("VeskReporting: %s", error.what());
      ::poll(nullptr, 0, 100);
    } catch (...) {
      VESK_LOG_ERROR("VeskReporting: an unknown exception");
    }
  }
  if (!_queue.ownsItsDescriptors()) {
    VESK_LOG_ERROR("VeskReporting: the session has ended: its process has closed its descriptors");
    _queue.close();
  }
  endEverything();
}

void SessionWorker::step() {
  Time now = Clock::now();
  takeRequests();
  takeCalls();
  tellOfDrops();
  endOverdue(now);
  reachDaemon(now);
  sendWaiting(now);
  sayFarewell(now);
  giveRoomBack();
  if (!isFinished(now)) sleep(now);
}

bool SessionWorker::isFinished(Time now) const noexcept {
  if (!_drainDeadline) return false;
  if (now >= *_drainDeadline || _farewell == Farewell::Answered) return true;
  return !_link.isReady() && (_waiting.empty() || _isHopeless);
}

void SessionWorker::endEverything() noexcept {
  _isClosed = true;
  tellOfDrops();
  _isConnected.store(false, std::memory_order_relaxed);
  _link.lose(Clock::now(), "the session was closed");
  if (_callsInBus > 0 && _waiting.front().wantsAnswer()) frontHasLeft();
  auto close = [this](const ClientCall& call) {
    _drops.unsent();
    finish(call.end, ReportingStatus::Closed, nullptr, "");
  };
  for (; !_waiting.empty(); frontHasLeft()) close(_waiting.front());
  for (const ClientCall& call : _taken) close(call);
  std::vector<ClientCall> last;
  _queue.takeAll(last);
  for (const ClientCall& call : last) close(call);
  endRequests(ReportingStatus::Closed, "");
  std::vector<ConnectionRequest> late;
  {
    MutexLock lock(_mutex);
    _hasEnded = true;
    late.swap(_newRequests);
  }
  for (const ConnectionRequest& request : late) finish(request.end, ReportingStatus::Closed, nullptr, "");
}

// --- What comes in

void SessionWorker::takeCalls() {
  // What could not be moved on for want of memory comes before what was queued since.
  if (_taken.empty()) _queue.takeAll(_taken);
  _isNapping = !_taken.empty();
  if (!_taken.empty() && _urgency == DaemonLink::Urgency::WhenDue) _urgency = DaemonLink::Urgency::Early;
  _waiting.append(_taken);
}

void SessionWorker::takeRequests() {
  MutexLock lock(_mutex);
  if (!_newRequests.empty() || _newDrainDeadline) _urgency = DaemonLink::Urgency::AtOnce;
  if (_newDrainDeadline) _drainDeadline = std::exchange(_newDrainDeadline, std::nullopt);
  _requests.reserve(_requests.size() + _newRequests.size());
  for (auto& request : std::exchange(_newRequests, {})) _requests.push_back(std::move(request));
}

// Here and not where the call was refused: a log may have a host's sink behind it, which takes its time.
void SessionWorker::tellOfDrops() noexcept {
  if (_drops.takeBurst()) {
    VESK_LOG_WARNING("VeskReporting: too much waits for the daemon, messages are dropped");
  }
}

void SessionWorker::endOverdue(Time now) {
  std::erase_if(_requests, [&](const ConnectionRequest& request) {
    if (request.deadline > now) return false;
    finish(request.end, _link.problemStatus(), nullptr, _link.problem());
    return true;
  });

  auto first = _waiting.firstDeadline();
  if (!first || *first > now) return;
  std::vector<ClientCall> overdue;
  _waiting.moveOverdue(overdue, now, _callsInBus == 0);
  auto status = _link.isReady() ? ReportingStatus::TimedOut : _link.problemStatus();
  for (const ClientCall& call : overdue) {
    if (call.call.member) {
      ++_callsGone;
      _memoryGone += call.memory;
      if (call.end) _drops.unsent();
    }
    finish(call.end, status, nullptr, _link.isReady() ? "" : _link.problem());
  }
}

void SessionWorker::endRequests(ReportingStatus status, std::string_view detail) {
  for (const auto& request : std::exchange(_requests, {})) finish(request.end, status, nullptr, detail);
}

void SessionWorker::sendMessageToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                        std::uint16_t category, std::uint16_t type,
                                        const std::optional<Dictionary>& payload) {
  auto handler = _memory.aggregation();
  if (!handler) return;
  try {
    (*handler)(AggregatedMessage{sessionInfo, timestamp, category, type, payload});
  } catch (...) {
    VESK_LOG_ERROR("VeskReporting: an aggregation handler threw an exception");
  }
}

// --- The link

bool SessionWorker::wantsDaemon() const noexcept {
  if (!_waiting.empty() || !_requests.empty()) return true;
  return !_drainDeadline && !_memory.isEmpty();
}

void SessionWorker::reachDaemon(Time now) {
  auto urgency = std::exchange(_urgency, DaemonLink::Urgency::WhenDue);
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
  // What the socket had not taken whole, the daemon has not seen: a one-way call is sent again. A call that
  // wants an answer has learnt of the loss already.
  if (_callsInBus > 0 && _waiting.front().wantsAnswer()) frontWasSent();
  _callsInBus = 0;
  _isHopeless = _drainDeadline && !_link.wasEverReady();
  endRequests(_link.problemStatus(), _link.problem());
}

// A daemon that does not know who we are must not get a message: without memory to tell it, try again later.
void SessionWorker::introduceAgain() {
  bool isTold = true;
  try {
    for (const IPCOutgoingCall* call : _memory.replay()) {
      if (!isTold || !call) continue;
      auto result = _link.bus().send(*call);
      isTold = result == BusClient::SendResult::Sent || result == BusClient::SendResult::Refused;
    }
  } catch (const std::exception&) {
    isTold = false;
  }
  if (!isTold) connectionBroke(Clock::now());
}

// --- Sending

bool SessionWorker::canSend() {
  if (!_link.isReady() || _waiting.empty() || _link.bus().queuedMessages() > 0) return false;
  return !_waiting.front().wantsAnswer() || _answersOwed < kMaximumAnswersOwed;
}

// Calls stay here until the socket has taken them: what only the bus held would be lost with the connection.
void SessionWorker::sendWaiting(Time now) {
  for (int i = 0; i < kWritesPerStep; ++i) {
    callsHaveLeft();
    if (!canSend()) return;
    if (_waiting.front().isPlain()) {
      sendTogether(now);
    } else {
      sendFront(now);
    }
  }
}

void SessionWorker::sendTogether(Time now) {
  BusClient& bus = _link.bus();
  const std::size_t most = std::min(_waiting.size(), kCallsPerWrite);
  while (_callsInBus < most && bus.addedBytes() < kBytesPerWrite) {
    ClientCall& call = _waiting.at(_callsInBus);
    if (!call.isPlain()) break;
    auto result = bus.add(call.call);
    if (result == BusClient::SendResult::Disconnected) return connectionBroke(now);
    if (result == BusClient::SendResult::OutOfResources) throw std::bad_alloc();  // later, then
    if (result == BusClient::SendResult::Sent) {
      handedOver(call);
    } else if (_callsInBus > 0) {
      break;  // once it is the front
    } else {
      _drops.invalid();
      return frontHasLeft();
    }
  }
  if (bus.write() == BusClient::Progress::Disconnected) return connectionBroke(now);
  callsHaveLeft();
}

void SessionWorker::sendFront(Time now) {
  ClientCall& front = _waiting.front();
  BusClient::SendResult result;
  if (front.descriptor && !front.descriptor.isOurs()) {
    _drops.unsent();
    finish(front.end, ReportingStatus::FileUnavailable, nullptr, "");
    return frontHasLeft();
  }
  if (front.wantsAnswer()) {
    auto left = std::chrono::ceil<std::chrono::milliseconds>(front.deadline - now);
    auto handler = [this, end = front.end, deadline = front.deadline](BusAnswer& answer) {
      --_answersOwed;
      finishWithAnswer(end, deadline, answer);
    };
    result = _link.bus().send(front.call, std::move(handler), left);
    if (result == BusClient::SendResult::Sent) ++_answersOwed;
  } else {
    result = _link.bus().send(front.call);
  }

  switch (result) {
    case BusClient::SendResult::Sent:
      front.deadline = Time::max();  // the bus minds it
      handedOver(front);
      return callsHaveLeft();
    case BusClient::SendResult::Refused:
      _drops.invalid();
      finish(front.end, ReportingStatus::InvalidArgument, nullptr, "");
      return frontHasLeft();
    case BusClient::SendResult::OutOfResources:
      _drops.unsent();
      finish(front.end, ReportingStatus::OutOfResources, nullptr, "");
      return frontHasLeft();
    case BusClient::SendResult::Disconnected:
      return connectionBroke(now);
  }
}

void SessionWorker::handedOver(const ClientCall& call) noexcept {
  _memory.sending(call);
  ++_callsInBus;
}

void SessionWorker::connectionBroke(Time now) {
  _link.lose(now, "the daemon has closed the connection");
  linkHasChanged(DaemonLink::Change::Lost);
}

void SessionWorker::callsHaveLeft() {
  if (_callsInBus == 0) return;
  std::size_t held = std::min(_callsInBus, _link.bus().queuedMessages());
  for (std::size_t left = std::exchange(_callsInBus, held) - held; left > 0; --left) frontWasSent();
  if (_callsGone >= kCallsPerWrite) giveRoomBack();
}

void SessionWorker::frontWasSent() noexcept {
  _memory.sent(std::move(_waiting.front().call), _waiting.front().effect);
  frontHasLeft();
}

void SessionWorker::frontHasLeft() noexcept {
  ++_callsGone;
  _memoryGone += _waiting.front().memory;
  _waiting.popFront();
}

void SessionWorker::giveRoomBack() noexcept {
  if (_callsGone == 0) return;
  _queue.leave(std::exchange(_callsGone, 0), std::exchange(_memoryGone, 0));
  if (_waiting.empty()) _drops.burstIsOver();
}

// The daemon serves calls in order: its answer to this one shows that it has taken all before. A connection
// closed sooner could fail under a daemon that still answers, and what it had not read yet would be lost.
void SessionWorker::sayFarewell(Time now) {
  bool isTime = _drainDeadline && _farewell == Farewell::NotYet && _link.isReady() && _waiting.empty() &&
                _answersOwed == 0;
  if (!isTime) return;
  auto result = _link.bus().send(
      {"org.freedesktop.DBus.Peer", "Ping", {}}, [this](BusAnswer&) { _farewell = Farewell::Answered; },
      std::chrono::ceil<std::chrono::milliseconds>(*_drainDeadline - now));
  _farewell = result == BusClient::SendResult::Sent ? Farewell::Asked : Farewell::Answered;
}

void SessionWorker::finish(const std::shared_ptr<CallEnd>& end, ReportingStatus status, BusAnswer* answer,
                           std::string_view detail) noexcept {
  if (!end) return;
  try {
    (*end)(status, answer, detail);
  } catch (...) {
    VESK_LOG_ERROR("VeskReporting: a callback threw an exception");
  }
}

void SessionWorker::finishWithAnswer(const std::shared_ptr<CallEnd>& end, Time deadline,
                                     BusAnswer& answer) noexcept {
  if (!answer.isError()) return finish(end, ReportingStatus::Done, &answer, "");
  if (answer.errorName() == "org.freedesktop.DBus.Error.Disconnected") {
    auto status = _isClosed ? ReportingStatus::Closed : ReportingStatus::NotConnected;
    return finish(end, status, nullptr, _isClosed ? "" : "the daemon has closed the connection");
  }
  // The same name stands for a time that ran out and for a daemon that gave no answer.
  bool isOverdue = answer.errorName() == "org.freedesktop.DBus.Error.NoReply" && Clock::now() >= deadline;
  finish(end, isOverdue ? ReportingStatus::TimedOut : ReportingStatus::Refused, nullptr, answer.errorText());
}

// --- Sleeping

void SessionWorker::sleep(Time now) {
  pollfd descriptors[] = {{_queue.descriptor(), POLLIN, 0}, {_link.descriptor(), _link.events(), 0}};
  Time due = nextDue(now);
  if (!_queue.prepareToSleep(wakeFor())) due = now;
  auto wait = std::chrono::ceil<std::chrono::milliseconds>(due - now).count();
  int ready = ::poll(descriptors, 2, static_cast<int>(std::clamp<long>(wait, 0, 3'600'000)));
  _queue.awake(ready > 0 && descriptors[0].revents != 0);

  now = Clock::now();
  auto linkDue = _link.nextDue(now);
  if ((ready > 0 && descriptors[1].revents != 0) || (linkDue && *linkDue <= now)) {
    linkHasChanged(_link.process(now));
  }
}

SessionWorker::Time SessionWorker::nextDue(Time now) {
  if (canSend()) return now;
  Time due = now + std::chrono::hours(1);
  auto consider = [&](std::optional<Time> time) {
    if (time && *time < due) due = *time;
  };
  if (_link.descriptor() >= 0 || wantsDaemon()) consider(_link.nextDue(now));
  for (const auto& request : _requests) consider(request.deadline);
  consider(_waiting.firstDeadline());
  consider(_drainDeadline);
  if (_isNapping && _waiting.empty()) consider(now + kNap);
  return due;
}

CallQueue::WakeFor SessionWorker::wakeFor() const noexcept {
  if (_link.isReady()) {
    return _waiting.empty() && !_isNapping ? CallQueue::WakeFor::EveryCall
                                           : CallQueue::WakeFor::AnsweredCalls;
  }
  bool isIdle = !wantsDaemon();
  return isIdle || _link.mayReachEarly() ? CallQueue::WakeFor::EveryCall : CallQueue::WakeFor::AnsweredCalls;
}

}  // namespace vesk
