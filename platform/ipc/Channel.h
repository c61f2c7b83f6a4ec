// Messages over one Unix stream socket. Private to platform/ipc.
#pragma once

#include <array>
#include <cstddef>
#include <deque>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/Message.h"

namespace vesk {

/// Both directions are bounded: at most one message and one read are held, and the owner stops reading while
/// written data is not taken. Never blocks; the owner polls. Large (it contains a read buffer), so it lives
/// on its thread's stack or in its own object. Not thread-safe.
class Channel {
 public:
  /// Size of one read.
  static constexpr std::size_t kPiece = 16 * 1024;

  enum class Input {
    Some,      ///< bytes have arrived
    Nothing,   ///< no bytes for now
    HungUp,    ///< the peer closed its end, between two messages
    BrokenOff  ///< the connection broke, or the peer violated the protocol: see `complaint`
  };
  enum class Next {
    Whole,       ///< `message` is the next one
    Incomplete,  ///< more bytes are needed
    Dropped,     ///< a message with an invalid header was removed; call again
    Refused      ///< the peer violated the protocol so that the connection must end: see `complaint`
  };

  /// Borrows `socket` (non-blocking). `maximumMessage`: limit on the bytes of one message.
  Channel(int socket, std::size_t maximumMessage) noexcept
      : _socket(socket), _maximumMessage(maximumMessage) {}

  // --- Input

  /// Makes one system call. All complete messages must have been taken out before.
  Input receive();
  /// Takes out the next message. `message` is valid until the next call of this or `receive`.
  Next next(Message& message);
  /// Received bytes that were not taken; for the data that precedes messages.
  std::string_view bytes() const noexcept { return {_piece.data() + _begin, _end - _begin}; }
  void skip(std::size_t size) noexcept { _begin += size; }
  /// Whether descriptors have arrived whose message is incomplete.
  bool hasDescriptors() const noexcept { return !_descriptors.empty(); }
  /// Bytes received so far.
  std::size_t received() const noexcept { return _received; }
  /// The protocol violation, or null if the peer just disconnected.
  const char* complaint() const noexcept { return _complaint; }

  // --- Output

  /// Append the next message here, then call `queued`.
  std::string& output() noexcept { return _output; }
  /// Marks the bytes appended since the last call as one message, sent together with `descriptor`.
  void queued(FileDescriptor descriptor = {});
  /// Writes as much as the socket takes. Returns false if the peer has disconnected.
  [[nodiscard]] bool flush();
  /// Discards unwritten output, for a peer that has disconnected.
  void dropOutput() noexcept;
  std::size_t unsentBytes() const noexcept { return _output.size() - _written; }
  /// The number of messages that the socket has not fully taken.
  std::size_t unsentMessages() const noexcept { return _ends.size(); }

 private:
  struct Attached {
    std::size_t offset;  // of the message's first byte in _output
    FileDescriptor descriptor;
  };

  Input refuse(const char* complaint) noexcept;
  Next complete(std::string_view bytes, Message& message);
  Next incomplete();

  const int _socket;
  const std::size_t _maximumMessage;
  const char* _complaint = nullptr;
  std::size_t _received = 0;

  HeaderParser _parser;
  std::vector<FileDescriptor> _descriptors;  // of messages that are still incomplete, in order
  std::string _large;                        // the received part of a message that is longer than a piece
  std::size_t _largeSize = 0;                // full size of that message; 0 if there is none
  std::size_t _begin = 0;                    // of the untaken bytes, in _piece
  std::size_t _end = 0;
  std::array<char, kPiece> _piece;

  std::string _output;
  std::size_t _written = 0;
  std::deque<std::size_t> _ends;   // ends of the messages in _output
  std::deque<Attached> _attached;  // not sent yet
};

}  // namespace vesk
