// The layout of D-Bus messages. Private to platform/ipc.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace vesk {

static_assert(std::endian::native == std::endian::little, "messages are written in little-endian order");

// The fixed part of a header: byte order, type, flags, version, then three 32-bit numbers. The fields follow,
// padded to a multiple of 8, then the body.
inline constexpr std::size_t kFlagsAt = 2;
inline constexpr std::size_t kBodySizeAt = 4;
inline constexpr std::size_t kSerialAt = 8;  // never 0
inline constexpr std::size_t kFieldsSizeAt = 12;
inline constexpr std::size_t kFixedHeader = 16;

inline constexpr char kLittleEndian = 'l';
inline constexpr char kBigEndian = 'B';
inline constexpr char kNoReplyExpected = 1;
inline constexpr char kProtocolVersion = 1;

enum HeaderField : std::uint8_t {
  kPath = 1,
  kInterface = 2,
  kMember = 3,
  kErrorName = 4,
  kReplySerial = 5,
  kDestination = 6,
  kSender = 7,
  kSignature = 8,
  kUnixDescriptors = 9
};

/// Limit on descriptors sent with one message; no member takes more than one.
inline constexpr std::size_t kMaximumDescriptors = 4;

/// Sent to a client beyond the limit, instead of an answer to its authentication.
inline constexpr std::string_view kTooManyConnections = "ERROR too many connections";

inline constexpr const char* kErrorFailed = "org.freedesktop.DBus.Error.Failed";
inline constexpr const char* kErrorNoReply = "org.freedesktop.DBus.Error.NoReply";
inline constexpr const char* kErrorDisconnected = "org.freedesktop.DBus.Error.Disconnected";
inline constexpr const char* kErrorInvalidArguments = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr const char* kErrorLimitsExceeded = "org.freedesktop.DBus.Error.LimitsExceeded";
inline constexpr const char* kErrorUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";
inline constexpr const char* kErrorUnknownInterface = "org.freedesktop.DBus.Error.UnknownInterface";
inline constexpr const char* kErrorUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
inline constexpr const char* kErrorUnknownProperty = "org.freedesktop.DBus.Error.UnknownProperty";

}  // namespace vesk
