#include "platform/ipc/BusClient.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <deque>
#include <list>
#include <system_error>

#include "platform/files/GuardedDescriptor.h"
#include "platform/ipc/BusCodec.h"
#include "platform/ipc/BusHandles.h"
#include "platform/ipc/BusReplies.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/OneWayOutbox.h"
#include "platform/ipc/UnixSocket.h"
#include "platform/ipc/WireFormat.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

using namespace std::chrono_literals;

// Steps of the bus in one `process`, so that a daemon that sends without end leaves the owner's loop its
// turn.
constexpr int kMaximumSteps = 64;

// The wire adds less than three times as much to what counts as content.
constexpr std::size_t kSurelyShort = OneWayEncoder::kMaximumMessage / 4;

/// Whether the daemon has said on `socket`, in place of authentication, that it has too many connections.
/// Takes nothing from the socket. `isSilent` when nothing is there to read.
bool isTurnedAway(int socket, bool& isSilent) {
  char line[kTooManyConnections.size()];
  const ssize_t size = ::recv(socket, line, sizeof line, MSG_PEEK | MSG_DONTWAIT);
  isSilent = size < 0 && errno == EAGAIN;
  return size > 0 && std::string_view(line, static_cast<std::size_t>(size)) == kTooManyConnections;
}

struct SlotReleaser {
  void operator()(sd_bus_slot* slot) const noexcept { sd_bus_slot_unref(slot); }
};

}  // namespace

bool BusAnswer::read(bool& out) { return _arguments && _arguments->read(out); }
bool BusAnswer::read(std::string& out) { return _arguments && _arguments->read(out); }
bool BusAnswer::read(std::optional<std::string>& out) { return _arguments && _arguments->read(out); }
bool BusAnswer::read(std::optional<Dictionary>& out) { return _arguments && _arguments->read(out); }
bool BusAnswer::read(std::optional<std::vector<std::string>>& out) {
  return _arguments && _arguments->read(out);
}

class BusClient::Implementation {
 public:
  explicit Implementation(Options options);
  ~Implementation() { end(); }

  void setExportedObject(std::shared_ptr<IPCExportedObject> object) {
    _router.setExportedObject(std::move(object));
  }
  SendResult send(const IPCOutgoingCall& call, AnswerHandler handler, std::chrono::milliseconds timeout);
  SendResult add(const IPCOutgoingCall& call);
  Progress writeAdded();
  std::size_t addedBytes() const { return _outbox.bytes(); }
  std::size_t queuedMessages() const;
  bool isReady() const { return _bus && sd_bus_is_ready(_bus.get()) > 0; }
  bool wasTurnedAway() const { return _wasTurnedAway; }
  int fd() const { return _bus ? sd_bus_get_fd(_bus.get()) : -1; }
  short events() const;
  int timeout() const;
  Progress process();

 private:
  struct Pending {
    Implementation* client;
    AnswerHandler handler;
    std::unique_ptr<sd_bus_slot, SlotReleaser> slot{};
  };
  using PendingList = std::list<Pending>;

  /// A call made before authentication was done, or while the socket still owes room to calls added before.
  /// sd-bus would queue it too in the first case, but for one with a descriptor it would wait.
  struct Deferred {
    BusMessageHandle message;
    PendingList::iterator pending;
    std::chrono::milliseconds timeout;
  };

  CodecResult addArguments(sd_bus_message* message, const IPCOutgoingCall& call) const;
  bool write(sd_bus_message* message, PendingList::iterator pending, std::chrono::milliseconds timeout);
  void sendDeferred();
  std::size_t queuedByBus() const;
  bool step(int& result);
  static int answered(sd_bus_message* message, void* pending, sd_bus_error* error) noexcept;
  static void call(AnswerHandler& handler, BusAnswer answer) noexcept;
  bool hasEnded() const { return !_bus || !_socket.isAt(fd()) || sd_bus_is_open(_bus.get()) <= 0; }
  void end() noexcept;

  const std::string _objectPath;
  const std::shared_ptr<BusReplies> _replies;
  CallRouter _router;
  BusHandle _bus;  // none once the connection has ended
  const DescriptorIdentity _socket;
  PendingList _pending;
  std::deque<Deferred> _deferred;
  OneWayOutbox _outbox;
  bool _hasMore = false;
  bool _wasTurnedAway = false;
};

BusClient::Implementation::Implementation(Options options)
    : _objectPath(std::move(options.objectPath)),
      _replies(std::make_shared<BusReplies>(nullptr)),
      _router(_objectPath, "client", _replies, {}),
      _bus(newBus(options.connected ? std::move(options.connected) : connectUnixSocket(options.socketPath))),
      _socket(fd()),
      _outbox(_objectPath) {
  _replies->open(_bus.get());
  // sd-bus closes its own when the daemon has closed the other end already.
  const FileDescriptor socket(::fcntl(fd(), F_DUPFD_CLOEXEC, 0));
  const int started = sd_bus_start(_bus.get());
  bool isSilent = false;
  if (started < 0 && isTurnedAway(socket.get(), isSilent)) {
    throw std::system_error(EUSERS, std::generic_category(), "connect");
  }
  checkBus(started, "sd_bus_start");
}

CodecResult BusClient::Implementation::addArguments(sd_bus_message* message,
                                                    const IPCOutgoingCall& call) const {
  BusEncoder encoder(message);
  if (!encoder.append(call.arguments)) return encoder.result();
  // The daemon ends the connection of whoever sends it a message that is too long.
  bool isTooLong = encoder.content() > kSurelyShort && OneWayEncoder(_objectPath).isTooLong(call);
  return isTooLong ? CodecResult::LimitExceeded : CodecResult::Ok;
}

BusClient::SendResult BusClient::Implementation::send(const IPCOutgoingCall& call, AnswerHandler handler,
                                                      std::chrono::milliseconds timeout) {
  if (hasEnded()) return SendResult::Disconnected;
  BusMessageHandle message = newCall(_bus.get(), _objectPath, call, static_cast<bool>(handler));
  if (!message) return SendResult::Disconnected;
  CodecResult result = addArguments(message.get(), call);
  if (result == CodecResult::OutOfResources) return SendResult::OutOfResources;
  if (result != CodecResult::Ok) return SendResult::Refused;

  auto pending = _pending.end();
  if (handler) pending = _pending.insert(_pending.end(), {this, std::move(handler)});
  if (!isReady() || !_outbox.empty() || !_deferred.empty()) {
    try {
      _deferred.push_back({std::move(message), pending, timeout});
    } catch (...) {
      if (pending != _pending.end()) _pending.erase(pending);
      throw;
    }
    return SendResult::Sent;
  }
  if (write(message.get(), pending, timeout)) return SendResult::Sent;
  if (pending != _pending.end()) _pending.erase(pending);
  return SendResult::Disconnected;
}

bool BusClient::Implementation::write(sd_bus_message* message, PendingList::iterator pending,
                                      std::chrono::milliseconds timeout) {
  if (pending == _pending.end()) return sd_bus_send(_bus.get(), message, nullptr) >= 0;
  sd_bus_slot* slot = nullptr;
  std::uint64_t limit = static_cast<std::uint64_t>(std::max(timeout, 1ms).count()) * 1000;
  if (sd_bus_call_async(_bus.get(), &slot, message, answered, &*pending, limit) < 0) return false;
  pending->slot.reset(slot);
  return true;
}

BusClient::SendResult BusClient::Implementation::add(const IPCOutgoingCall& call) {
  // Behind what sd-bus holds only sd-bus may write.
  if (!isReady() || !_deferred.empty() || queuedByBus() > 0) return send(call, nullptr, 0ms);
  return _outbox.add(call) == CodecResult::Ok ? SendResult::Sent : SendResult::Refused;
}

BusClient::Progress BusClient::Implementation::writeAdded() {
  if (!_bus) return Progress::Disconnected;
  if (_outbox.empty() || queuedByBus() > 0) return Progress::Connected;
  if (hasEnded() || !_outbox.write(fd())) {
    end();
    return Progress::Disconnected;
  }
  sendDeferred();
  return Progress::Connected;
}

/// A failure is that of the connection; its end tells the handlers.
void BusClient::Implementation::sendDeferred() {
  while (!_deferred.empty() && _outbox.empty()) {
    Deferred deferred = std::move(_deferred.front());
    _deferred.pop_front();
    write(deferred.message.get(), deferred.pending, deferred.timeout);
  }
}

void BusClient::Implementation::call(AnswerHandler& handler, BusAnswer answer) noexcept {
  try {
    handler(answer);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: The handler of an answer failed: %s", error.what());
  }
}

int BusClient::Implementation::answered(sd_bus_message* message, void* data, sd_bus_error*) noexcept {
  Implementation* self = static_cast<Pending*>(data)->client;
  auto pending = std::find_if(self->_pending.begin(), self->_pending.end(),
                              [data](const Pending& entry) { return &entry == data; });
  if (pending == self->_pending.end()) return 1;
  PendingList taken;
  taken.splice(taken.end(), self->_pending, pending);
  const sd_bus_error* error = sd_bus_message_get_error(message);
  if (!error) {
    BusDecoder decoder(message);
    call(taken.front().handler, BusAnswer(decoder));
  } else if (sd_bus_is_open(self->_bus.get()) <= 0) {
    call(taken.front().handler, BusAnswer(SD_BUS_ERROR_DISCONNECTED, "The connection has ended"));
  } else {
    call(taken.front().handler, BusAnswer(error->name, error->message ? error->message : ""));
  }
  return 1;
}

std::size_t BusClient::Implementation::queuedByBus() const {
  std::uint64_t queued = 0;
  if (_bus) sd_bus_get_n_queued_write(_bus.get(), &queued);
  return queued;
}

std::size_t BusClient::Implementation::queuedMessages() const {
  return queuedByBus() + _deferred.size() + _outbox.messages();
}

short BusClient::Implementation::events() const {
  if (!_bus) return 0;
  int events = sd_bus_get_events(_bus.get());
  return static_cast<short>(_outbox.empty() ? events : events | POLLOUT);
}

int BusClient::Implementation::timeout() const {
  std::uint64_t deadline = 0;
  if (_hasMore) return 0;
  if (!_bus || sd_bus_get_timeout(_bus.get(), &deadline) <= 0 || deadline == UINT64_MAX) return -1;
  // sd-bus counts on the clock that steady_clock reads.
  auto at = std::chrono::steady_clock::time_point(std::chrono::microseconds(deadline));
  auto left = std::chrono::ceil<std::chrono::milliseconds>(at - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::clamp<long long>(left, 0, INT_MAX));
}

/// False when the connection has ended. `result`: 0 when there was nothing to do.
bool BusClient::Implementation::step(int& result) {
  if (!isReady()) {
    // sd-bus would take an answer that it does not know and say nothing of it.
    bool isSilent = false;
    _wasTurnedAway = isTurnedAway(fd(), isSilent);
    if (_wasTurnedAway) return false;
    if (isSilent && (events() & POLLOUT) == 0) return true;
  }
  const bool wasReady = isReady();
  const int socket = fd();
  sd_bus_message* raw = nullptr;
  result = sd_bus_process(_bus.get(), &raw);
  BusMessageHandle message(raw);
  if (message) _router.route(raw);
  if (result >= 0 && sd_bus_is_open(_bus.get()) > 0) return true;
  bool isSilent = false;
  _wasTurnedAway = !wasReady && isTurnedAway(socket, isSilent);
  return false;
}

BusClient::Progress BusClient::Implementation::process() {
  if (!_bus) return Progress::Disconnected;
  if (hasEnded()) {
    end();
    return Progress::Disconnected;
  }
  _hasMore = false;
  if (writeAdded() == Progress::Disconnected) return Progress::Disconnected;
  // In the middle of a message nothing else may be written. sd-bus itself writes only what we ask for and
  // answers to calls that want one, which the daemon does not make.
  if (!_outbox.insideMessage()) _replies->sendWaiting();
  for (int steps = 0; steps < kMaximumSteps; ++steps) {
    int result = 0;
    if (!step(result)) {
      end();
      return Progress::Disconnected;
    }
    if (isReady()) sendDeferred();
    if (result == 0) return Progress::Connected;
  }
  _hasMore = true;
  return Progress::Connected;
}

void BusClient::Implementation::end() noexcept {
  _replies->close();
  _deferred.clear();
  PendingList owed;
  owed.swap(_pending);
  for (auto& pending : owed) pending.slot.reset();
  // A process forked from this one may hold the socket too, and would keep the session alive in the daemon.
  // In that process sd-bus gives no descriptor.
  const int socket = fd();
  if (socket >= 0 && !_socket.isAt(socket)) {
    // The host has closed the socket, and the number may be its own by now: sd-bus would close that, so it is
    // never let go.
    static_cast<void>(_bus.release());
  } else if (socket >= 0) {
    ::shutdown(socket, SHUT_RDWR);
  }
  _bus.reset();
  for (auto& pending : owed) {
    call(pending.handler, BusAnswer(SD_BUS_ERROR_DISCONNECTED, "The connection has ended"));
  }
}

BusClient::BusClient(Options options)
    : _implementation(std::make_unique<Implementation>(std::move(options))) {}

BusClient::~BusClient() = default;

void BusClient::setExportedObject(std::shared_ptr<IPCExportedObject> object) {
  _implementation->setExportedObject(std::move(object));
}

BusClient::SendResult BusClient::send(const IPCOutgoingCall& call) {
  return _implementation->send(call, nullptr, 0ms);
}

BusClient::SendResult BusClient::send(const IPCOutgoingCall& call, AnswerHandler handler,
                                      std::chrono::milliseconds timeout) {
  return _implementation->send(call, std::move(handler), timeout);
}

BusClient::SendResult BusClient::add(const IPCOutgoingCall& call) { return _implementation->add(call); }
BusClient::Progress BusClient::write() { return _implementation->writeAdded(); }
std::size_t BusClient::addedBytes() const { return _implementation->addedBytes(); }

std::size_t BusClient::queuedMessages() const { return _implementation->queuedMessages(); }
bool BusClient::isReady() const { return _implementation->isReady(); }
bool BusClient::wasTurnedAway() const { return _implementation->wasTurnedAway(); }
int BusClient::fd() const { return _implementation->fd(); }
short BusClient::events() const { return _implementation->events(); }
int BusClient::timeout() const { return _implementation->timeout(); }
BusClient::Progress BusClient::process() { return _implementation->process(); }

}  // namespace vesk
