#include "platform/ipc/BusClient.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <climits>

#include "platform/ipc/MessageWriter.h"
#include "platform/ipc/UnixSocket.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// Limit on messages served in one `process`, so that a busy daemon doesn't starve the owner's loop.
constexpr int kMaximumSteps = 64;

// In bytes; the system may allow less. Small messages take several times their size in the kernel.
constexpr int kSendBuffer = 1 << 20;

void tell(BusClient::AnswerHandler& handler, BusAnswer answer) noexcept {
  try {
    handler(answer);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: The handler of an answer failed: %s", error.what());
  }
}

}  // namespace

BusClient::BusClient(Options options)
    : _process(::getpid()),
      _socket(GuardedDescriptor(options.connected ? std::move(options.connected)
                                                  : connectUnixSocket(options.socketPath))),
      _router(options.objectPath, "client", _outbox, {}),
      _objectPath(std::move(options.objectPath)),
      _channel(_socket.get(), kMaximumMessageSize) {
  ::fcntl(_socket.get(), F_SETFL, ::fcntl(_socket.get(), F_GETFL) | O_NONBLOCK);
  ::setsockopt(_socket.get(), SOL_SOCKET, SO_SNDBUF, &kSendBuffer, sizeof kSendBuffer);
  _channel.output() += SaslClient::greeting();
  _channel.queued();
  // `process` notices if the daemon has already disconnected.
  [[maybe_unused]] const bool isThere = _channel.flush();
}

BusClient::SendResult BusClient::append(const IPCEncodedCall& call, bool expectsReply) {
  if (!_socket) return SendResult::Disconnected;
  FileDescriptor descriptor;
  if (call.descriptor.borrowed >= 0) {
    descriptor = FileDescriptor(::fcntl(call.descriptor.borrowed, F_DUPFD_CLOEXEC, 3));
    if (!descriptor) return SendResult::OutOfResources;
  }
  std::string& output = _channel.output();
  const std::size_t start = output.size();
  output += call.message;
  stamp(output.data() + start, ++_lastSerial, expectsReply);
  _channel.queued(std::move(descriptor));
  return SendResult::Sent;
}

bool BusClient::isOurs() const { return ::getpid() == _process; }

BusClient::SendResult BusClient::send(const IPCOutgoingCall& call, AnswerHandler handler,
                                      std::chrono::milliseconds timeout) {
  IPCEncodedCall encoded;
  if (appendCall(_objectPath, call, encoded.message) != CodecResult::Ok) return SendResult::Refused;
  for (const auto& argument : call.arguments) {
    if (const auto* descriptor = std::get_if<IPCDescriptor>(&argument)) encoded.descriptor = *descriptor;
  }
  return send(encoded, std::move(handler), timeout);
}

BusClient::SendResult BusClient::send(const IPCEncodedCall& call, AnswerHandler handler,
                                      std::chrono::milliseconds timeout) {
  const auto result = append(call, static_cast<bool>(handler));
  if (result != SendResult::Sent) return result;
  const std::uint32_t serial = _lastSerial;
  if (write() == Progress::Disconnected) return SendResult::Disconnected;
  if (handler) {
    const auto deadline = std::chrono::steady_clock::now() + std::max(timeout, std::chrono::milliseconds(1));
    _owed.emplace(serial, Owed{std::move(handler), deadline});
  }
  return result;
}

/// Until the daemon has authenticated us, calls wait behind the greeting.
BusClient::Progress BusClient::write() {
  if (!_socket) return disconnected();
  _outbox->moveAnswersTo(_channel);
  if (_channel.unsentBytes() == 0) return Progress::Connected;
  if (hasEnded()) return disconnected();
  return !_isReady || _channel.flush() ? Progress::Connected : disconnected();
}

short BusClient::events() const {
  if (!_socket) return 0;
  return static_cast<short>(_isReady && _channel.unsentBytes() > 0 ? POLLIN | POLLOUT : POLLIN);
}

int BusClient::timeout() const {
  if (_hasMore) return 0;
  if (_owed.empty()) return -1;
  auto first = std::min_element(_owed.begin(), _owed.end(), [](const auto& a, const auto& b) {
    return a.second.deadline < b.second.deadline;
  });
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(first->second.deadline - std::chrono::steady_clock::now());
  return static_cast<int>(std::clamp<long long>(left.count(), 0, INT_MAX));
}

BusClient::Progress BusClient::process() {
  if (write() == Progress::Disconnected) return Progress::Disconnected;
  if (!_hasMore) {
    if (hasEnded()) return disconnected();
    const auto input = _channel.receive();
    if (input == Channel::Input::HungUp || input == Channel::Input::BrokenOff) return disconnected();
  }
  if (!serve()) return disconnected();
  expire();
  return write();
}

/// Returns false if the daemon refuses authentication.
bool BusClient::authenticate() {
  const auto step = _sasl.step(_channel.bytes());
  _channel.skip(step.taken);
  _isReady = step.verdict == SaslClient::Verdict::Accepted;
  return step.verdict != SaslClient::Verdict::Refused;
}

bool BusClient::serve() {
  _hasMore = false;
  if (!_isReady && !authenticate()) return false;
  for (int step = 0; _isReady && step < kMaximumSteps; ++step) {
    Message message;
    const auto next = _channel.next(message);
    if (next == Channel::Next::Incomplete) return true;
    if (next == Channel::Next::Refused) return false;
    if (next == Channel::Next::Whole) deliver(message);
  }
  _hasMore = _isReady;
  return true;
}

void BusClient::deliver(Message& message) {
  const MessageHeader& header = *message.header;
  if (header.type == MessageType::Call) return _router.route(message);
  const auto owed = _owed.find(header.replySerial);
  if (owed == _owed.end()) return;
  MessageReader reader(message);
  if (header.type == MessageType::Answer) {
    settle(owed, BusAnswer(reader));
  } else if (header.type == MessageType::Error) {
    std::string text;
    const bool hasText = reader.read(text);
    settle(owed, BusAnswer(header.errorName, hasText ? text : std::string_view()));
  }
}

void BusClient::expire() {
  const auto now = std::chrono::steady_clock::now();
  for (auto owed = _owed.begin(); owed != _owed.end();) {
    const auto current = owed++;
    if (current->second.deadline <= now) settle(current, BusAnswer(kErrorNoReply, "Method call timed out"));
  }
}

void BusClient::settle(OwedAnswers::iterator owed, BusAnswer answer) {
  auto handler = std::move(owed->second.handler);
  _owed.erase(owed);
  tell(handler, answer);
}

BusClient::Progress BusClient::disconnected() {
  end();
  return Progress::Disconnected;
}

void BusClient::end() noexcept {
  _outbox->close();
  // A forked process may also hold the socket, which would keep the session alive in the daemon. The forked
  // process itself must not end the connection, since it doesn't own it.
  if (!hasEnded() && isOurs()) ::shutdown(_socket.get(), SHUT_RDWR);
  _socket = {};
  OwedAnswers owed;
  owed.swap(_owed);
  for (auto& [serial, entry] : owed) {
    tell(entry.handler, BusAnswer(kErrorDisconnected, "The connection has ended"));
  }
}

}  // namespace vesk
