// The dashboard's datagrams: a header of 64 bytes, then text. docs/dashboard.md describes them. Only this
// file knows their layout, for the daemon and the collector.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

inline constexpr std::size_t kDashboardHeaderSize = 64;
inline constexpr std::size_t kDashboardTextArea = 1024;  ///< bytes; the last one stays unused
inline constexpr std::size_t kDashboardBufferSize = kDashboardHeaderSize + kDashboardTextArea;
inline constexpr std::size_t kDashboardLongestDatagram = kDashboardBufferSize - 1;
inline constexpr std::size_t kDashboardDeviceIDSize = 40;

/// Any datagram that is long enough to contain an event ID, at the same offset, is an acknowledgement.
inline constexpr std::size_t kDashboardEventIDOffset = 60;
inline constexpr std::size_t kDashboardShortestAcknowledgement = kDashboardEventIDOffset + 2;

/// The header's contents in host byte order, with complements undone.
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
  std::array<char, kDashboardDeviceIDSize> deviceID{};  ///< not terminated; padded with NULs
  std::uint16_t eventID = 0;
  bool isReliable = false;  ///< the sender waits for an acknowledgement
  bool isWithoutProfile = false;

  /// The device ID up to the first NUL.
  std::string_view deviceIDText() const noexcept;
  unsigned milliseconds() const noexcept { return subsecond * 4u; }
  friend bool operator==(const DashboardHeader&, const DashboardHeader&) = default;
};

/// Writes 64 bytes to `out`.
void encodeDashboardHeader(const DashboardHeader& header, char* out) noexcept;
/// Returns nullopt if there are fewer than 64 bytes, the version byte is not 1, or the stated length differs
/// from the datagram's.
std::optional<DashboardHeader> decodeDashboardHeader(std::string_view datagram) noexcept;
/// The event ID in an acknowledgement; nullopt if the datagram is too short for one.
std::optional<std::uint16_t> eventIDOfAcknowledgement(std::string_view datagram) noexcept;

/// The line for the local message log, at most 1151 bytes. Built from the datagram, so that it shows the
/// values as sent. Returns nullopt for a malformed datagram, or if the line is not UTF-8, for example because
/// a character was cut.
std::optional<std::string> writeLocalLog(std::string_view datagram);

}  // namespace vesk
