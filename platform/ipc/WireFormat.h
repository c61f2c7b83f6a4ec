// The layout of D-Bus messages, and how what they hold is counted. Private to platform/ipc.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace vesk {

static_assert(std::endian::native == std::endian::little,
              "messages are read and written in the machine's own order");

// The fixed part of a header: byte order, type, flags, version, then three numbers of 32 bits. The fields
// come behind it, filled up to a multiple of 8, and then the body.
inline constexpr std::size_t kBodySizeAt = 4;
inline constexpr std::size_t kSerialAt = 8;  // never 0
inline constexpr std::size_t kFieldsSizeAt = 12;
inline constexpr std::size_t kFixedHeader = 16;

inline constexpr char kLittleEndian = 'l';
inline constexpr char kBigEndian = 'B';
inline constexpr char kMethodCall = 1;
inline constexpr char kNoReplyExpected = 1;
inline constexpr char kProtocolVersion = 1;

enum HeaderField : std::uint8_t { kPath = 1, kInterface = 2, kMember = 3, kSignature = 8, kDescriptors = 9 };

/// What a client in excess is told, in place of an answer to its authentication.
inline constexpr std::string_view kTooManyConnections = "ERROR too many connections\r\n";

/// sd-bus refuses more open containers, with the same error as for broken bytes, so its receiver would too. A
/// dictionary in a dictionary is three: array, entry, variant.
inline constexpr std::size_t kMaximumContainers = 127;

/// What a value counts for in `CodecLimits::content` besides its text or bytes.
inline constexpr std::size_t kNodeContent = 8;

}  // namespace vesk
