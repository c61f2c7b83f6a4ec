// One-way calls from their bytes. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ipc/BusCodec.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// What a one-way call brought. The texts among the arguments share one copy of the message's body.
struct OneWayCall {
  std::string_view interfaceName;  ///< empty when the caller left it out
  std::string_view member;
  std::string_view signature;
  std::vector<IPCArgument> arguments;
};

/// Reads what clients send most, at a quarter of what it costs to have sd-bus receive and read it. It takes
/// nothing that is out of the ordinary: any other message, or a broken one, is left to sd-bus, which says
/// what is wrong with it. So whatever this reads, sd-bus would read as the same values. For one thread.
class OneWayDecoder {
 public:
  /// Of a message, in bytes.
  static constexpr std::size_t kMaximumMessage = 8 * 1024;

  explicit OneWayDecoder(std::string objectPath, CodecLimits limits = {})
      : _objectPath(std::move(objectPath)), _limits(limits) {}

  /// Whether a message of `size` bytes that begins with these (at least the fixed part of its header)
  /// may be one to read here.
  static bool mayDecode(std::string_view header, std::uint64_t size) noexcept;

  /// `message`: one whole message that `mayDecode`. The call's names are good until the next call of this.
  std::optional<OneWayCall> decode(std::string_view message);

 private:
  bool readHeader(std::string_view message);

  const std::string _objectPath;
  const CodecLimits _limits;
  // The header of the last call without body length and serial, which the next most often repeats.
  std::string _header;
  std::string _interfaceName;
  std::string _member;
  std::string _signature;
};

}  // namespace vesk
