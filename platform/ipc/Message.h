// One D-Bus message as it came over the wire. Private to platform/ipc.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/WireFormat.h"

namespace vesk {

enum class MessageType : std::uint8_t { Call = 1, Answer = 2, Error = 3, Signal = 4 };

/// What a header says; the texts of absent fields are empty.
struct MessageHeader {
  MessageType type = MessageType::Call;  ///< other numbers are possible, and such messages are ignored
  bool expectsReply = false;
  bool isBigEndian = false;
  std::uint32_t replySerial = 0;
  std::uint32_t descriptors = 0;
  std::string path;
  std::string interfaceName;
  std::string member;
  std::string errorName;
  std::string signature;
};

/// A whole message, whose header keeps the rules; its body has not been looked at. `header` and `body` are
/// good until the next message is read; the descriptors are closed with it.
struct Message {
  const MessageHeader* header = nullptr;
  std::uint32_t serial = 0;
  std::string_view body;
  std::vector<FileDescriptor> descriptors;

  /// Whether any of them has not been taken.
  bool hasDescriptors() const noexcept {
    return std::any_of(descriptors.begin(), descriptors.end(), [](const auto& one) { return bool(one); });
  }
};

/// Whether `path` is a D-Bus object path.
bool isObjectPath(std::string_view path) noexcept;

/// Size of the message that begins with these bytes (kFixedHeader at least); nothing when they begin none.
std::optional<std::uint64_t> messageSize(std::string_view bytes) noexcept;

/// Reads headers. A client repeats the same header with most of its calls, so the last one is kept and
/// compared first. For one thread.
class HeaderParser {
 public:
  /// `bytes`: one whole message of `messageSize`. Null when its header breaks a rule of the format.
  const MessageHeader* parse(std::string_view bytes);
  /// Of the message parsed last: where its body begins, and its number.
  std::size_t headerSize() const noexcept { return kFieldsSizeAt + _fields.size(); }
  std::uint32_t serial() const noexcept { return _serial; }

 private:
  MessageHeader _header;
  std::uint32_t _serial = 0;
  char _start[kBodySizeAt] = {};  // of the last header: byte order, type, flags, version
  std::string _fields;            // the rest of it, from the size of the fields on; empty when there was none
};

}  // namespace vesk
