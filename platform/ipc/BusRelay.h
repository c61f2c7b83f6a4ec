// Between a client's socket and sd-bus. Private to platform/ipc.
#pragma once

#include <array>
#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/AuthenticationGate.h"
#include "platform/ipc/MessageGate.h"
#include "platform/ipc/OneWayDecoder.h"

namespace vesk {

/// sd-bus takes messages of up to 128 MiB, any number of descriptors along with each, and drops a broken
/// message without a word, and its descriptors stay open for good; it reads on at once, all of that within
/// one call; and an answer that finds its client gone takes the messages with it that the client had sent
/// before it went. So sd-bus does not have a client's socket but the inner end of a socket pair. What has
/// passed the gates is written into it, and what sd-bus answers is taken out of it. Descriptors pass only
/// with a whole call that takes them. Many small messages cross in one read and one write. For the
/// connection's thread.
class BusRelay {
 public:
  /// One read's worth, each way. Small, because each connection has them on its stack.
  static constexpr std::size_t kPiece = 16 * 1024;
  static constexpr std::size_t kOutgoingPiece = 4 * 1024;
  /// Descriptors that may come with one message; no member takes more than one.
  static constexpr std::size_t kMaximumDescriptors = 4;

  /// Serves a whole message without sd-bus; false when that has to.
  using OneWayHandler = std::function<bool(std::string_view message)>;

  enum class Outcome {
    Fed,       ///< something went on to sd-bus
    Served,    ///< whole messages were served without it
    Nothing,   ///< nothing to read now, or not enough
    HungUp,    ///< the peer has closed its end, between two messages
    BrokenOff  ///< it broke off, or was refused: see `complaint`
  };

  /// Borrows `socket` (not blocking). Descriptors are for the object at `objectPath`. Throws
  /// std::system_error.
  BusRelay(int socket, uid_t peer, std::string objectPath, std::size_t maximumMessage, OneWayHandler oneWay);

  /// The end for sd-bus; to be taken once.
  FileDescriptor takeInnerEnd() { return std::move(_inner); }

  /// Reads from the client. What it has fed must be processed by sd-bus before the next call.
  Outcome takeIn();

  /// Takes what sd-bus has written and gives the client what it has room for. True when something moved.
  bool passOut();
  /// Whether the client has to read before more can go out.
  bool isBlocked() const noexcept { return !_outgoing.empty(); }

  /// Whether the client has said BEGIN: all that follows are messages.
  bool hasBegun() const noexcept { return _hasBegun; }
  /// Whether `takeIn` has work although the socket may have nothing to read.
  bool hasHeldMessages() const noexcept { return _hasUnseen; }
  bool insideMessage() const noexcept { return _held > 0 || _messages.insideMessage(); }
  /// Messages handed to sd-bus so far, whole.
  std::uint64_t finishedMessages() const noexcept { return _messages.finished(); }
  /// Bytes read from the socket so far.
  std::size_t received() const noexcept { return _received; }
  /// What was refused, or null when the peer just went away.
  const char* complaint() const noexcept { return _complaint; }

 private:
  struct Received {
    std::size_t bytes = 0;
    std::vector<FileDescriptor> descriptors{};
  };

  /// Descriptors, and where the message that they came with starts in the buffer.
  struct Attached {
    std::size_t start;
    std::vector<FileDescriptor> descriptors;
  };

  Outcome receive(Received& received);
  Outcome authenticate();
  bool attach(std::vector<FileDescriptor> descriptors, std::size_t heldBefore);
  Outcome passMessages();
  Outcome passOrdinary(std::size_t end);
  Outcome passDescriptorCall();
  std::size_t serveOneWayCalls(std::string_view messages);
  bool waitsForOneWayCall() const;
  Outcome refuse(const char* complaint);
  bool write(std::string_view data, std::vector<FileDescriptor> descriptors = {});
  void keepFrom(std::size_t offset);
  std::string_view held() const { return {_buffer.data(), _held}; }

  const int _socket;
  const std::string _objectPath;
  FileDescriptor _inner;
  FileDescriptor _outer;
  AuthenticationGate _authentication;
  MessageGate _messages;
  const OneWayHandler _oneWay;
  bool _hasBegun = false;
  bool _hasUnseen = false;  // what is held has not been looked at
  const char* _complaint = nullptr;
  std::vector<Attached> _attached;  // in the order of their messages
  std::size_t _received = 0;
  std::size_t _held = 0;  // bytes at the front of the buffer that wait for more
  std::array<char, kPiece> _buffer;
  bool _clientGone = false;
  std::string_view _outgoing;  // the part of the buffer that the client has not taken
  std::array<char, kOutgoingPiece> _outgoingBuffer;
};

}  // namespace vesk
