#include "platform/ipc/Channel.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <utility>

namespace vesk {

namespace {

/// Takes ownership of every descriptor in a received message, so that none leaks.
void takeDescriptors(msghdr& header, std::vector<FileDescriptor>& descriptors) {
  for (cmsghdr* control = CMSG_FIRSTHDR(&header); control; control = CMSG_NXTHDR(&header, control)) {
    if (control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (control->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(control) + i * sizeof(int), sizeof descriptor);
      descriptors.emplace_back(descriptor);
    }
  }
}

}  // namespace

Channel::Input Channel::refuse(const char* complaint) noexcept {
  _complaint = complaint;
  return Input::BrokenOff;
}

// --- Input

Channel::Input Channel::receive() {
  // Moves the remaining bytes to the front, to make room for the rest.
  if (_begin > 0) std::memmove(_piece.data(), _piece.data() + _begin, _end - _begin);
  _end -= std::exchange(_begin, 0);
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMaximumDescriptors)];
  iovec space{_piece.data() + _end, _piece.size() - _end};
  msghdr header{};
  header.msg_iov = &space;
  header.msg_iovlen = 1;
  header.msg_control = control;
  header.msg_controllen = sizeof control;
  const ssize_t size = ::recvmsg(_socket, &header, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (size < 0) return errno == EAGAIN || errno == EINTR ? Input::Nothing : Input::BrokenOff;
  if (header.msg_controllen > 0) takeDescriptors(header, _descriptors);
  // The kernel closed descriptors that didn't fit, either in the control data or in this process's table.
  const bool areTooMany = (header.msg_flags & MSG_CTRUNC) != 0 || _descriptors.size() > kMaximumDescriptors;
  if (areTooMany) return refuse("too many descriptors");
  if (size == 0) return _end > _begin || _largeSize > 0 ? Input::BrokenOff : Input::HungUp;
  _end += static_cast<std::size_t>(size);
  _received += static_cast<std::size_t>(size);
  return Input::Some;
}

Channel::Next Channel::next(Message& message) {
  message = {};
  if (_largeSize > 0) {
    const std::size_t size = std::min(_largeSize - _large.size(), _end - _begin);
    _large.append(_piece.data() + _begin, size);
    skip(size);
    if (_large.size() < _largeSize) return incomplete();
    _largeSize = 0;
    return complete(_large, message);
  }
  if (!_large.empty()) _large = {};
  if (bytes().size() < kFixedHeader) return incomplete();
  const auto size = messageSize(bytes());
  if (!size || *size > _maximumMessage) {
    refuse(size ? "a message over the size limit" : "no D-Bus message");
    return Next::Refused;
  }
  const auto whole = bytes().substr(0, *size);
  if (whole.size() == *size) {
    skip(*size);
    return complete(whole, message);
  }
  if (*size > kPiece) {
    _largeSize = *size;
    _large.assign(whole);
    _begin = _end;
  }
  return incomplete();
}

Channel::Next Channel::incomplete() {
  if (_begin < _end || _largeSize > 0 || _descriptors.empty()) return Next::Incomplete;
  refuse("descriptors without a message");
  return Next::Refused;
}

/// A message's descriptors arrive with its first byte, and the message announces their number.
Channel::Next Channel::complete(std::string_view bytes, Message& message) {
  const MessageHeader* header = _parser.parse(bytes);
  const std::size_t announced = header ? header->descriptors : 0;
  // Extra descriptors may belong to the next message, if that has begun.
  const bool mayBeLater = _begin < _end && header != nullptr;
  if (announced > _descriptors.size() || (announced < _descriptors.size() && !mayBeLater)) {
    refuse("descriptors that don't match their message");
    return Next::Refused;
  }
  if (!header) return Next::Dropped;
  const auto end = _descriptors.begin() + static_cast<std::ptrdiff_t>(announced);
  message.descriptors.assign(std::make_move_iterator(_descriptors.begin()), std::make_move_iterator(end));
  _descriptors.erase(_descriptors.begin(), end);
  message.header = header;
  message.body = bytes.substr(_parser.headerSize());
  message.serial = _parser.serial();
  return Next::Whole;
}

// --- Output

void Channel::queued(FileDescriptor descriptor) {
  const std::size_t begin = _ends.empty() ? _written : _ends.back();
  if (descriptor) _attached.push_back({begin, std::move(descriptor)});
  _ends.push_back(_output.size());
}

bool Channel::flush() {
  while (_written < _output.size()) {
    // A descriptor is sent with the first byte of its message, so earlier bytes are written separately.
    std::size_t end = _output.size();
    int descriptor = -1;
    if (!_attached.empty()) {
      const bool isNext = _attached.front().offset == _written;
      if (isNext) descriptor = _attached.front().descriptor.get();
      if (!isNext) end = _attached.front().offset;
      if (isNext && _attached.size() > 1) end = _attached[1].offset;
    }
    iovec piece{_output.data() + _written, end - _written};
    msghdr header{};
    header.msg_iov = &piece;
    header.msg_iovlen = 1;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    if (descriptor >= 0) {
      header.msg_control = control;
      header.msg_controllen = sizeof control;
      cmsghdr* rights = CMSG_FIRSTHDR(&header);
      rights->cmsg_level = SOL_SOCKET;
      rights->cmsg_type = SCM_RIGHTS;
      rights->cmsg_len = CMSG_LEN(sizeof(int));
      std::memcpy(CMSG_DATA(rights), &descriptor, sizeof descriptor);
    }
    const ssize_t size = ::sendmsg(_socket, &header, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (size < 0 && errno == EINTR) continue;
    if (size < 0) return errno == EAGAIN;
    if (descriptor >= 0) _attached.pop_front();
    _written += static_cast<std::size_t>(size);
    while (!_ends.empty() && _ends.front() <= _written) _ends.pop_front();
  }
  dropOutput();
  return true;
}

void Channel::dropOutput() noexcept {
  constexpr std::size_t kKeptCapacity = kPiece;
  if (_output.capacity() > kKeptCapacity) _output = {};
  _output.clear();
  _written = 0;
  _ends.clear();
  _attached.clear();
}

}  // namespace vesk
