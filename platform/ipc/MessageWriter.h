// D-Bus messages, in bytes. Private to platform/ipc.
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

/// What a message to be written says in its header; empty texts and zeros are left out.
struct OutgoingHeader {
  MessageType type = MessageType::Call;
  bool expectsReply = false;
  std::string_view path{};
  std::string_view interfaceName{};
  std::string_view member{};
  std::string_view errorName{};
  std::uint32_t replySerial = 0;
};

/// Bytes of a message that either end takes: the content is limited to 1 MiB, with an error that says so, and
/// what is around it to 64 KiB.
inline constexpr std::size_t kMaximumMessageSize = (std::size_t{1} << 20) + 64 * 1024;

/// Appends a message to `out`, in little-endian order. Unless it returns Ok, `out` is as before, also when it
/// throws. `serial` is not 0. Descriptors among the arguments are counted; the caller sends them along.
CodecResult appendMessage(const OutgoingHeader& header, std::uint32_t serial,
                          const std::vector<IPCArgument>& arguments, std::string& out,
                          CodecLimits limits = {});

/// Appends a call of an object, as `appendMessage`. Its sender sets its number.
CodecResult appendCall(std::string_view objectPath, const IPCOutgoingCall& call, std::string& out);

/// Numbers a whole message, and says whether it wants an answer.
void stamp(char* message, std::uint32_t serial, bool expectsReply) noexcept;

}  // namespace vesk
