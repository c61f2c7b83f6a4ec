#include "platform/ipc/OneWayOutbox.h"

#include <sys/socket.h>

#include <cerrno>

namespace vesk {

namespace {

// sd-bus counts its own messages from 1 upwards.
constexpr std::uint32_t kSerials = 0x8000'0000;

}  // namespace

CodecResult OneWayOutbox::add(const IPCOutgoingCall& call) {
  const std::size_t start = _buffer.size();
  CodecResult result = _encoder.append(call, kSerials | ++_serial, _buffer);
  if (result != CodecResult::Ok) return result;
  try {
    _ends.push_back(_buffer.size());
  } catch (...) {
    _buffer.resize(start);
    throw;
  }
  return result;
}

bool OneWayOutbox::write(int socket) noexcept {
  while (_written < _buffer.size()) {
    ssize_t size =
        ::send(socket, _buffer.data() + _written, _buffer.size() - _written, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (size < 0 && errno == EINTR) continue;
    if (size < 0 && errno == EAGAIN) return true;
    if (size <= 0) return false;
    _written += static_cast<std::size_t>(size);
    _isInside = true;
    while (!_ends.empty() && _ends.front() <= _written) {
      _isInside = _ends.front() < _written;
      _ends.pop_front();
    }
  }
  _buffer.clear();
  _written = 0;
  return true;
}

}  // namespace vesk
