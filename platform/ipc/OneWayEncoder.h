// One-way calls as D-Bus messages, in bytes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/ipc/BusCodec.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Encodes what a client sends most. sd-bus takes two thirds of the time that a one-way call costs its
/// sender, and writes each with a system call of its own; a call that nobody answers needs neither its
/// bookkeeping nor its queue. What is written is what sd-bus would write (little-endian, without
/// descriptors). For one thread.
class OneWayEncoder {
 public:
  /// Longer messages are refused, as they are by the daemon.
  static constexpr std::size_t kMaximumMessage = std::size_t{1} << 20;

  explicit OneWayEncoder(std::string objectPath, CodecLimits limits = {})
      : _objectPath(std::move(objectPath)), _limits(limits) {}

  /// Appends a message to `out`. Unless it returns Ok, `out` is as before, also when it throws
  /// std::bad_alloc. The call's names are constants: what was made of them is kept.
  CodecResult append(const IPCOutgoingCall& call, std::uint32_t serial, std::string& out);

  /// Whether `call`, sent in any way, would be too long a message.
  bool isTooLong(const IPCOutgoingCall& call) {
    std::string out;
    return append(call, 1, out) == CodecResult::LimitExceeded;
  }

 private:
  /// The part of a message that calls of one member have in common.
  struct Header {
    const char* interfaceName;
    const char* member;
    std::string signature;
    std::string bytes;  ///< without body length and serial
  };

  CodecResult appendTo(std::string& out, std::size_t start, const IPCOutgoingCall& call,
                       std::uint32_t serial);
  const std::string& headerFor(const IPCOutgoingCall& call, const std::string& signature);

  const std::string _objectPath;
  const CodecLimits _limits;
  std::vector<Header> _headers;
  std::string _signature;
};

}  // namespace vesk
