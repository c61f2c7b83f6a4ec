#include "platform/ipc/BusRelay.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <system_error>

#include "platform/ipc/DescriptorCall.h"
#include "platform/ipc/WireFormat.h"

namespace vesk {

namespace {

constexpr std::size_t kControlSize = CMSG_SPACE(sizeof(int) * BusRelay::kMaximumDescriptors);

/// Takes every descriptor out of a received message, so that none is left open unseen.
std::vector<FileDescriptor> takeDescriptors(msghdr& header) {
  std::vector<FileDescriptor> descriptors;
  for (cmsghdr* control = CMSG_FIRSTHDR(&header); control; control = CMSG_NXTHDR(&header, control)) {
    if (control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_RIGHTS) continue;
    std::size_t count = (control->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(control) + i * sizeof(int), sizeof descriptor);
      descriptors.emplace_back(descriptor);
    }
  }
  return descriptors;
}

}  // namespace

static_assert(kMaximumDescriptorCall <= BusRelay::kPiece, "such a call is held whole");

BusRelay::BusRelay(int socket, uid_t peer, std::string objectPath, std::size_t maximumMessage,
                   OneWayHandler oneWay)
    : _socket(socket),
      _objectPath(std::move(objectPath)),
      _authentication(peer),
      _messages(maximumMessage),
      _oneWay(std::move(oneWay)) {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) {
    throw std::system_error(errno, std::generic_category(), "socketpair");
  }
  _inner = FileDescriptor(ends[0]);
  _outer = FileDescriptor(ends[1]);
  // Whatever the machine's default: a whole piece must fit, bookkeeping included.
  int size = 4 * kPiece;
  ::setsockopt(ends[1], SOL_SOCKET, SO_SNDBUF, &size, sizeof size);
}

BusRelay::Outcome BusRelay::refuse(const char* complaint) {
  _complaint = complaint;
  return Outcome::BrokenOff;
}

BusRelay::Outcome BusRelay::receive(Received& received) {
  alignas(cmsghdr) char control[kControlSize];
  iovec space{_buffer.data() + _held, _buffer.size() - _held};
  msghdr header{};
  header.msg_iov = &space;
  header.msg_iovlen = 1;
  header.msg_control = control;
  header.msg_controllen = sizeof control;
  ssize_t size = ::recvmsg(_socket, &header, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (size < 0) return errno == EAGAIN || errno == EINTR ? Outcome::Nothing : Outcome::BrokenOff;
  if (header.msg_controllen > 0) received.descriptors = takeDescriptors(header);
  // The kernel has closed what found no room, be it in the control data or in this process's table.
  if (header.msg_flags & MSG_CTRUNC) return refuse("too many descriptors");
  if (size == 0) return insideMessage() ? Outcome::BrokenOff : Outcome::HungUp;
  received.bytes = static_cast<std::size_t>(size);
  return Outcome::Fed;
}

BusRelay::Outcome BusRelay::takeIn() {
  // What is held unseen is looked at before more is read.
  if (hasHeldMessages()) return passMessages();
  Received received;
  auto outcome = receive(received);
  if (outcome != Outcome::Fed) return outcome;
  const std::size_t heldBefore = std::exchange(_held, _held + received.bytes);
  _received += received.bytes;
  if (!_hasBegun) {
    outcome = authenticate();
    // A message that was read together with BEGIN may have brought descriptors.
    bool isEarly = !received.descriptors.empty() && (!_hasBegun || _held == 0);
    if (isEarly) return refuse("a descriptor before authentication");
    return attach(std::move(received.descriptors), 0) ? outcome : refuse("descriptors within a message");
  }
  if (!attach(std::move(received.descriptors), heldBefore)) return refuse("descriptors within a message");
  return passMessages();
}

BusRelay::Outcome BusRelay::authenticate() {
  auto result = _authentication.pass(held());
  if (result.verdict == AuthenticationGate::Verdict::Refused) return refuse("no D-Bus authentication");
  if (!write(result.passedOn)) return refuse("internal failure");
  keepFrom(result.taken);
  _hasBegun = result.verdict == AuthenticationGate::Verdict::Begun;
  _hasUnseen = _hasBegun && _held >= kFixedHeader;
  return result.passedOn.empty() ? Outcome::Nothing : Outcome::Fed;
}

/// A read ends with the piece that descriptors came with, and every D-Bus library sends them along with the
/// first byte of their message: so it is the last message that has begun. False when none has begun in that
/// read.
bool BusRelay::attach(std::vector<FileDescriptor> descriptors, std::size_t heldBefore) {
  if (descriptors.empty()) return true;
  MessageGate ahead = _messages;
  auto result = ahead.pass(held());
  if (result.passed == _held && !result.lastStart) return false;
  const std::size_t start = result.passed < _held ? result.passed : *result.lastStart;
  if (start < heldBefore) return false;
  _attached.push_back({start, std::move(descriptors)});
  return true;
}

/// How many bytes at the front have been served.
std::size_t BusRelay::serveOneWayCalls(std::string_view messages) {
  std::size_t served = 0;
  // What has been handed to sd-bus before has been processed, so the order is kept.
  while (!_messages.insideMessage() && messages.size() - served >= kFixedHeader) {
    auto rest = messages.substr(served);
    auto size = MessageGate::messageSize(rest);
    if (!size || *size > rest.size() || !OneWayDecoder::mayDecode(rest, *size)) break;
    if (!_oneWay(rest.substr(0, *size))) break;
    served += *size;
  }
  return served;
}

/// Whether a call is held whose end has not come yet, and which may be served without sd-bus then.
bool BusRelay::waitsForOneWayCall() const {
  if (_messages.insideMessage() || _held < kFixedHeader) return false;
  auto size = MessageGate::messageSize(held());
  return size && *size > _held && OneWayDecoder::mayDecode(held(), *size);
}

BusRelay::Outcome BusRelay::passMessages() {
  _hasUnseen = false;
  if (_attached.empty()) return passOrdinary(_held);
  if (_attached.front().start == 0) return passDescriptorCall();
  auto outcome = passOrdinary(_attached.front().start);
  _hasUnseen = outcome != Outcome::BrokenOff;
  return outcome;
}

/// Passes what is held up to `end`, where a message starts that comes with descriptors, or all of it.
BusRelay::Outcome BusRelay::passOrdinary(std::size_t end) {
  const std::size_t served = serveOneWayCalls(held().substr(0, end));
  keepFrom(served);
  end -= served;
  const auto idle = served > 0 ? Outcome::Served : Outcome::Nothing;
  if (end == 0 || waitsForOneWayCall()) return idle;
  auto result = _messages.pass(held().substr(0, end));
  if (!write(held().substr(0, result.passed))) return refuse("internal failure");
  keepFrom(result.passed);
  if (result.verdict == MessageGate::Verdict::TooLarge) return refuse("a message over the size limit");
  if (result.verdict == MessageGate::Verdict::Malformed) return refuse("no D-Bus message");
  return result.passed > 0 ? Outcome::Fed : idle;
}

/// The message at the front came with descriptors: passes it once it is held whole.
BusRelay::Outcome BusRelay::passDescriptorCall() {
  if (_held < kFixedHeader) return Outcome::Nothing;
  auto size = MessageGate::messageSize(held());
  if (!size) return refuse("no D-Bus message");
  if (*size > kMaximumDescriptorCall) return refuse("a message with descriptors over the size limit");
  if (*size > _held) return Outcome::Nothing;
  auto message = held().substr(0, *size);
  auto descriptors = std::move(_attached.front().descriptors);
  _attached.erase(_attached.begin());
  if (!isDescriptorCall(message, _objectPath, descriptors.size())) {
    return refuse("descriptors that its call does not take");
  }
  _messages.pass(message);
  if (!write(message, std::move(descriptors))) return refuse("internal failure");
  keepFrom(*size);
  _hasUnseen = _held > 0;
  return Outcome::Fed;
}

bool BusRelay::write(std::string_view data, std::vector<FileDescriptor> descriptors) {
  if (data.empty()) return true;
  iovec piece{const_cast<char*>(data.data()), data.size()};
  msghdr header{};
  header.msg_iov = &piece;
  header.msg_iovlen = 1;
  alignas(cmsghdr) char control[kControlSize] = {};
  if (!descriptors.empty()) {
    header.msg_control = control;
    header.msg_controllen = CMSG_SPACE(sizeof(int) * descriptors.size());
    cmsghdr* rights = CMSG_FIRSTHDR(&header);
    rights->cmsg_level = SOL_SOCKET;
    rights->cmsg_type = SCM_RIGHTS;
    rights->cmsg_len = CMSG_LEN(sizeof(int) * descriptors.size());
    for (std::size_t i = 0; i < descriptors.size(); ++i) {
      int descriptor = descriptors[i].get();
      std::memcpy(CMSG_DATA(rights) + i * sizeof(int), &descriptor, sizeof descriptor);
    }
  }
  ssize_t written = ::sendmsg(_outer.get(), &header, MSG_DONTWAIT | MSG_NOSIGNAL);
  return written == static_cast<ssize_t>(data.size());
}

/// An answer for a client that has gone is dropped: what it had sent before it went is served all the same.
bool BusRelay::passOut() {
  bool moved = false;
  for (;;) {
    if (_outgoing.empty()) {
      ssize_t size = ::recv(_outer.get(), _outgoingBuffer.data(), _outgoingBuffer.size(), MSG_DONTWAIT);
      if (size <= 0) return moved;
      _outgoing = {_outgoingBuffer.data(), static_cast<std::size_t>(size)};
      moved = true;
    }
    ssize_t sent = _clientGone
                       ? static_cast<ssize_t>(_outgoing.size())
                       : ::send(_socket, _outgoing.data(), _outgoing.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent >= 0) {
      _outgoing.remove_prefix(static_cast<std::size_t>(sent));
    } else if (errno == EAGAIN) {
      return moved;
    } else if (errno != EINTR) {
      _clientGone = true;
    }
  }
}

void BusRelay::keepFrom(std::size_t offset) {
  _held -= offset;
  for (Attached& attached : _attached) attached.start -= offset;
  if (_held > 0) std::memmove(_buffer.data(), _buffer.data() + offset, _held);
}

}  // namespace vesk
