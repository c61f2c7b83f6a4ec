// One received D-Bus message. Private to platform/ipc.
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

/// The contents of a header; the texts of absent fields are empty.
struct MessageHeader {
  MessageType type = MessageType::Call;  ///< other numbers may occur; such messages are ignored
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

/// A whole message with a valid header; its body has not been checked. `header` and `body` are valid until
/// the next message is read. The descriptors are closed with the message.
struct Message {
  const MessageHeader* header = nullptr;
  std::uint32_t serial = 0;
  std::string_view body;
  std::vector<FileDescriptor> descriptors;

  /// Whether any descriptor has not been taken.
  bool hasDescriptors() const noexcept {
    return std::any_of(descriptors.begin(), descriptors.end(), [](const auto& one) { return bool(one); });
  }
};

/// Whether `path` is a D-Bus object path.
bool isObjectPath(std::string_view path) noexcept;

/// The size of the message that starts with these bytes (at least kFixedHeader). Returns nullopt if they
/// don't start a message.
std::optional<std::uint64_t> messageSize(std::string_view bytes) noexcept;

/// Reads headers. Most calls of a client repeat the same header, so the last one is kept and compared first.
/// Not thread-safe.
class HeaderParser {
 public:
  /// `bytes`: one whole message of `messageSize`. Returns null if its header is invalid.
  const MessageHeader* parse(std::string_view bytes);
  /// Size of the last parsed message's header, where its body begins, and its serial number.
  std::size_t headerSize() const noexcept { return kFieldsSizeAt + _fields.size(); }
  std::uint32_t serial() const noexcept { return _serial; }

 private:
  MessageHeader _header;
  std::uint32_t _serial = 0;
  char _start[kBodySizeAt] = {};  // of the last header: byte order, type, flags, version
  std::string _fields;  // the rest of it, starting with the size of the fields; empty if there was no header
};

}  // namespace vesk
