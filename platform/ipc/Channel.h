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

/// Both directions are bounded: what has come is held up to one message and one read, and the owner stops
/// reading while what it has written is not taken. Waits for nothing; the owner polls. Large (it holds one
/// read's worth), so it lives on its thread's stack or in an object of its own. For one thread.
class Channel {
 public:
  /// One read's worth.
  static constexpr std::size_t kPiece = 16 * 1024;

  enum class Input {
    Some,      ///< bytes have come
    Nothing,   ///< none now
    HungUp,    ///< the peer has closed its end, between two messages
    BrokenOff  ///< it broke off, or broke a rule: see `complaint`
  };
  enum class Next {
    Whole,       ///< `message` is the next one
    Incomplete,  ///< more has to come first
    Dropped,     ///< one was taken out whose header breaks the rules inside; ask again
    Refused      ///< the peer broke a rule that ends the connection: see `complaint`
  };

  /// Borrows `socket` (non-blocking). `maximumMessage`: bytes of one message that is taken.
  Channel(int socket, std::size_t maximumMessage) noexcept
      : _socket(socket), _maximumMessage(maximumMessage) {}

  // --- Input

  /// One system call. What has come before must have been taken out as far as possible.
  Input receive();
  /// Takes the next message out of what has come. `message` is good until the next call of this or `receive`.
  Next next(Message& message);
  /// What has come and was not taken; for what precedes messages.
  std::string_view bytes() const noexcept { return {_piece.data() + _begin, _end - _begin}; }
  void skip(std::size_t size) noexcept { _begin += size; }
  /// Whether descriptors have come whose message is not complete.
  bool hasDescriptors() const noexcept { return !_descriptors.empty(); }
  /// Bytes received so far.
  std::size_t received() const noexcept { return _received; }
  /// What was refused, or null when the peer just went away.
  const char* complaint() const noexcept { return _complaint; }

  // --- Output

  /// Where the next message is to be appended, followed by `queued`.
  std::string& output() noexcept { return _output; }
  /// The bytes appended since the last call are one message more; `descriptor` goes along with it.
  void queued(FileDescriptor descriptor = {});
  /// Writes what the socket takes. False when the peer has gone.
  [[nodiscard]] bool flush();
  /// Forgets what is not written: a peer that has gone reads nothing.
  void dropOutput() noexcept;
  std::size_t unsentBytes() const noexcept { return _output.size() - _written; }
  /// Messages of which the socket has not taken every byte.
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
  std::vector<FileDescriptor> _descriptors;  // came with messages that are not complete yet, in order
  std::string _large;                        // a message longer than a piece, as far as it has come
  std::size_t _largeSize = 0;                // of it when whole; 0 when there is none
  std::size_t _begin = 0;                    // of what was not taken, in _piece
  std::size_t _end = 0;
  std::array<char, kPiece> _piece;

  std::string _output;
  std::size_t _written = 0;
  std::deque<std::size_t> _ends;   // of the messages in _output
  std::deque<Attached> _attached;  // not sent yet
};

}  // namespace vesk
