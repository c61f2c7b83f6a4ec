// Writes D-Bus messages. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ipc/Codec.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/Message.h"

namespace vesk {

/// The header of a message to be written; empty texts and zeros are left out.
struct OutgoingHeader {
  MessageType type = MessageType::Call;
  bool expectsReply = false;
  std::string_view path{};
  std::string_view interfaceName{};
  std::string_view member{};
  std::string_view errorName{};
  std::uint32_t replySerial = 0;
};

/// Maximum bytes of a message that either end accepts: the content is limited to 1 MiB, with an error that
/// says so, and the rest to 64 KiB.
inline constexpr std::size_t kMaximumMessageSize = (std::size_t{1} << 20) + 64 * 1024;

/// Appends a message to `out`, in little-endian order. Leaves `out` unchanged unless it returns Ok, also if
/// it throws. `serial` must not be 0. Descriptors among the arguments are counted; the caller must send them
/// with the message.
CodecResult appendMessage(const OutgoingHeader& header, std::uint32_t serial,
                          const std::vector<IPCArgument>& arguments, std::string& out,
                          CodecLimits limits = {});

/// Appends a call to an object, like `appendMessage`. The sender sets its serial number.
CodecResult appendCall(std::string_view objectPath, const IPCOutgoingCall& call, std::string& out);

/// Sets the serial number of a whole message, and whether it expects an answer.
void stamp(char* message, std::uint32_t serial, bool expectsReply) noexcept;

}  // namespace vesk
