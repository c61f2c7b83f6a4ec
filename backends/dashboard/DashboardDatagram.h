// The dashboard's datagrams: a header of 64 bytes, then the text. docs/dashboard.md describes them; this is
// the one place that knows their layout, for the daemon and for the collector.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

inline constexpr std::size_t kDashboardHeaderSize = 64;
inline constexpr std::size_t kDashboardTextArea = 1024;  ///< of which the last byte stays unused
inline constexpr std::size_t kDashboardBufferSize = kDashboardHeaderSize + kDashboardTextArea;
inline constexpr std::size_t kDashboardLongestDatagram = kDashboardBufferSize - 1;
inline constexpr std::size_t kDashboardDeviceIDSize = 40;

/// An acknowledgement is any datagram that is long enough to carry the event ID where the datagram had it.
inline constexpr std::size_t kDashboardEventIDOffset = 60;
inline constexpr std::size_t kDashboardShortestAcknowledgement = kDashboardEventIDOffset + 2;

/// What the header carries, in host order and with its complements undone.
struct DashboardHeader {
  std::uint8_t libraryVersionMajor = 0;
  std::uint8_t clientType = 0;
  std::uint8_t subsecond = 0;  ///< in steps of 4 ms
  std::uint32_t seconds = 0;   ///< since 1970
  std::uint32_t sessionID = 0;
  std::uint16_t clientVersion = 0;
  std::uint16_t length = 0;  ///< of the whole datagram
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::array<char, kDashboardDeviceIDSize> deviceID{};  ///< not terminated; NULs when it is shorter
  std::uint16_t eventID = 0;
  bool isReliable = false;  ///< an acknowledgement is waited for
  bool isWithoutProfile = false;

  /// Up to the first NUL.
  std::string_view deviceIDText() const noexcept;
  unsigned milliseconds() const noexcept { return subsecond * 4u; }
  friend bool operator==(const DashboardHeader&, const DashboardHeader&) = default;
};

/// Writes 64 bytes.
void encodeDashboardHeader(const DashboardHeader& header, char* out) noexcept;
/// Nothing for fewer than 64 bytes, for a version byte other than 1, or when the datagram's length is not the
/// one that it states.
std::optional<DashboardHeader> decodeDashboardHeader(std::string_view datagram) noexcept;
/// The event ID that an acknowledgement carries; nothing when it is too short for one.
std::optional<std::uint16_t> eventIDOfAcknowledgement(std::string_view datagram) noexcept;

/// The line for the local message log, made from the datagram, so that it shows the values as they travel. At
/// most 1151 bytes. Nothing for what is no datagram, and when the line is not UTF-8, as after a cut through a
/// character.
std::optional<std::string> writeLocalLog(std::string_view datagram);

}  // namespace vesk
