// One-way calls on their way to the socket, many to a write.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>

#include "platform/ipc/OneWayEncoder.h"

namespace vesk {

/// Gathers messages and writes them together. For one thread.
class OneWayOutbox {
 public:
  explicit OneWayOutbox(std::string objectPath) : _encoder(std::move(objectPath)) {}

  CodecResult add(const IPCOutgoingCall& call);

  /// Writes as much as the socket takes. False when the connection has ended.
  [[nodiscard]] bool write(int socket) noexcept;

  bool empty() const noexcept { return _ends.empty(); }
  /// Messages of which the socket has not taken every byte.
  std::size_t messages() const noexcept { return _ends.size(); }
  /// Bytes that the socket has not taken.
  std::size_t bytes() const noexcept { return _buffer.size() - _written; }
  /// The socket has taken a part of a message: nothing else may be written before the rest.
  bool insideMessage() const noexcept { return _isInside; }

 private:
  OneWayEncoder _encoder;
  std::string _buffer;
  std::size_t _written = 0;
  std::deque<std::size_t> _ends;  ///< of the messages, in _buffer
  std::uint32_t _serial = 0;
  bool _isInside = false;
};

}  // namespace vesk
